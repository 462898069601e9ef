#include "platform/sdbus/WireAuthentication.h"

#include <algorithm>
#include <numeric>
#include <optional>

namespace qv::platform::sdbus {
namespace {

constexpr std::string_view kLineEnd = "\r\n";
constexpr std::string_view kBegin = "BEGIN\r\n";

/// What is missing of a line of which `begun` is there, at the least.
size_t restOfLine(std::string_view begun) { return begun.ends_with('\r') ? 1 : kLineEnd.size(); }

std::string hexadecimal(std::string_view text) {
  constexpr char kDigits[] = "0123456789abcdef";
  std::string digits;
  for (const char each : text) {
    digits += kDigits[static_cast<uint8_t>(each) >> 4];
    digits += kDigits[static_cast<uint8_t>(each) & 15];
  }
  return digits;
}

bool isHexadecimal(std::string_view text) {
  return text.find_first_not_of("0123456789abcdefABCDEF") == std::string_view::npos;
}

/// What follows `command`; nothing where the line is another one.
std::optional<std::string_view> argumentOf(std::string_view line, std::string_view command) {
  if (!line.starts_with(command)) return std::nullopt;
  line.remove_prefix(command.size());
  if (line.empty()) return line;
  if (line.front() != ' ') return std::nullopt;
  return line.substr(1);
}

/// Threading: one thread.
class ClientLines final : public WireAuthentication {
 public:
  ClientLines(uid_t peer, uid_t own)
      : peerToken_(hexadecimal(std::to_string(peer))), ownToken_(hexadecimal(std::to_string(own))) {}

  Step take(std::string_view line, std::string& passed) override {
    if (line == "BEGIN") return begin(passed);
    if (const auto token = argumentOf(line, "DATA")) return data(*token, passed);
    passed += answerable(line);
    passed += kLineEnd;
    return Step::GoesOn;
  }
  size_t least(std::string_view begun) const override {
    if (kBegin.starts_with(begun)) return kBegin.size() - begun.size();
    return restOfLine(begun) + kBegin.size();
  }
  bool agreedOnDescriptors() const override { return agreed_; }
  bool beginsWithZero() const override { return true; }

 private:
  enum class State { Unknown, Challenged, Known };

  Step begin(std::string& passed) {
    if (state_ != State::Known) return Step::Refused;
    passed += kBegin;
    return Step::Ends;
  }

  Step data(std::string_view token, std::string& passed) {
    if (state_ != State::Challenged) return Step::Refused;
    const bool isPeer = token.empty() || token == peerToken_;
    state_ = isPeer ? State::Known : State::Unknown;
    // sd-bus refuses what was cancelled, as it would a wrong identity.
    passed += isPeer ? "DATA " + ownToken_ : "CANCEL";
    passed += kLineEnd;
    return Step::GoesOn;
  }

  /// Each of these gets an answer.
  std::string answerable(std::string_view line) {
    if (const auto token = argumentOf(line, "AUTH EXTERNAL")) {
      if (token->empty()) {
        state_ = State::Challenged;
        return "AUTH EXTERNAL";
      }
      state_ = *token == peerToken_ ? State::Known : State::Unknown;
      return state_ == State::Known ? "AUTH EXTERNAL " + ownToken_ : "AUTH";
    }
    if (line == "NEGOTIATE_UNIX_FD" && state_ == State::Known) {
      agreed_ = true;
      return std::string(line);
    }
    if (argumentOf(line, "AUTH")) {
      state_ = State::Unknown;
      return "AUTH";
    }
    if (line != "CANCEL" && !argumentOf(line, "ERROR")) return "UNKNOWN";
    state_ = State::Unknown;
    return "CANCEL";
  }

  const std::string peerToken_;
  const std::string ownToken_;
  State state_ = State::Unknown;
  bool agreed_ = false;
};

/// sd-bus waits for these three lines.
///
/// Threading: one thread.
class ServerLines final : public WireAuthentication {
 public:
  Step take(std::string_view line, std::string& passed) override {
    if (!isExpected(line)) return Step::Refused;
    agreed_ = line == "AGREE_UNIX_FD";
    passed += ++taken_ == kLines && !agreed_ ? "ERROR" : line;
    passed += kLineEnd;
    return taken_ == kLines ? Step::Ends : Step::GoesOn;
  }
  size_t least(std::string_view begun) const override {
    const size_t rest = begun.size() < kLeastLines[taken_] ? kLeastLines[taken_] - begun.size() : 0;
    return std::max(rest, restOfLine(begun)) +
           std::accumulate(kLeastLines + taken_ + 1, kLeastLines + kLines, size_t{0});
  }
  bool agreedOnDescriptors() const override { return agreed_; }
  bool beginsWithZero() const override { return false; }

 private:
  static constexpr size_t kLines = 3;
  static constexpr size_t kServerBytes = 32;
  /// Bytes of each with its end: DATA, OK and who the server is, ERROR.
  static constexpr size_t kLeastLines[kLines] = {6, 3 + kServerBytes + 2, 7};

  bool isExpected(std::string_view line) const {
    if (taken_ == 0) return line == "DATA";
    if (taken_ == 2) return line == "AGREE_UNIX_FD" || argumentOf(line, "ERROR");
    const auto server = argumentOf(line, "OK");
    return server && server->size() == kServerBytes && isHexadecimal(*server);
  }

  size_t taken_ = 0;
  bool agreed_ = false;
};

}  // namespace

std::unique_ptr<WireAuthentication> authenticationOfClient(uid_t peer, uid_t own) {
  return std::make_unique<ClientLines>(peer, own);
}

std::unique_ptr<WireAuthentication> authenticationOfServer() { return std::make_unique<ServerLines>(); }

}  // namespace qv::platform::sdbus
