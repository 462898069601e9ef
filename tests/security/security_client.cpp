/// A client of the daemon that speaks by hand, as whichever user and program it is told to be.
///
///   security_client SOCKET [DESCRIPTOR]       the descriptor of a connection that a former program has made
///   security_client -                         it does nothing
///
/// It takes commands on descriptor 3 and says one line for each: user N, connect, start, start system, stop,
/// become PROGRAM (with its connection), lend N PROGRAM (a child of user N connects, asks for a system recording, and
/// becomes that program at once), answer (that this child would have got). What is said of a request: "ok", a code,
/// "refused" or "closed"; of a stop the movie's URL.
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <string>

#include "tests/sdbus/RawCall.h"
#include "tests/security/ByHand.h"

namespace {

using qv::security::hello;
using qv::security::readAgreement;

constexpr const char kInterface[] = "com.tarnwick.quorveld.QVDaemonProtocol";
constexpr int kCommands = 3;
constexpr int64_t kCodes[] = {-5803, -5810};

template <typename T>
std::string bytesOf(T value) {
  return {reinterpret_cast<const char*>(&value), sizeof value};
}

std::string startCall(bool system) {
  // au, (dd), bbbbb, ah
  std::string body =
      bytesOf(uint32_t{4}) + bytesOf(static_cast<uint32_t>(::getpid())) + bytesOf(640.0) + bytesOf(360.0);
  for (const bool flag : {false, false, false, system, false}) body += bytesOf(uint32_t{flag});
  body += bytesOf(uint32_t{0});
  return qv::platform::test::rawCall(kInterface, "startRecordingWindowLayerContextIDs", "au(dd)bbbbbah", body);
}

std::string call(const std::string& member) { return qv::platform::test::rawCall(kInterface, member, "", ""); }

class Link {
 public:
  Link(std::string path, int descriptor) : path_(std::move(path)), socket_(descriptor) {}
  [[nodiscard]] int descriptor() const { return socket_; }
  void open() {
    if (socket_ >= 0) ::close(socket_);
    socket_ = ::socket(AF_UNIX, SOCK_STREAM, 0);
  }
  bool connect() const { return qv::security::connectSocket(socket_, path_); }
  bool send(const std::string& bytes) const {
    return ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
  }
  /// The next answer to a call; empty when the connection has ended.
  std::string readAnswer() const {
    for (;;) {
      std::string head = readBytes(16);
      if (head.empty()) return {};
      const uint32_t bodySize = numberAt(head, 4);
      const uint32_t fieldsSize = numberAt(head, 12);
      const std::string rest = readBytes((fieldsSize + 7) / 8 * 8 + bodySize);
      if (head[1] == 2) return head + rest;
      if (head[1] == 3) return head + rest;
    }
  }

 private:
  static uint32_t numberAt(const std::string& bytes, size_t at) {
    uint32_t value = 0;
    std::memcpy(&value, bytes.data() + at, sizeof value);
    return value;
  }
  [[nodiscard]] std::string readBytes(size_t size) const {
    std::string bytes(size, '\0');
    for (size_t length = 0; length < size;) {
      const ssize_t got = ::read(socket_, bytes.data() + length, size - length);
      if (got <= 0) return {};
      length += static_cast<size_t>(got);
    }
    return bytes;
  }
  const std::string path_;
  int socket_;
};

std::string meaningOf(const std::string& answer) {
  if (answer.empty()) return "closed";
  if (const size_t url = answer.find("file:///"); url != std::string::npos) return answer.c_str() + url;
  for (const int64_t code : kCodes) {
    if (answer.find(bytesOf(code)) != std::string::npos) return std::to_string(code);
  }
  if (answer[1] == 3) return "refused";
  return answer.find("ErrorDomain") == std::string::npos ? "ok" : "failed";
}

std::string request(const Link& link, const std::string& bytes) {
  return link.send(bytes) ? meaningOf(link.readAnswer()) : "closed";
}

std::string connectAnew(Link& link) {
  link.open();
  if (!link.connect() || !link.send(hello()) || !readAgreement(link.descriptor())) return "closed";
  return request(link, call("synchronousGetCurrentState"));
}

/// A child connects, asks for a system recording, and becomes another program at once, as long as this process is
/// there. Its connection is left to this one. Returns when the kernel runs the program.
std::string lend(Link& link, uid_t user, const std::string& program) {
  int sent[2];
  if (::pipe2(sent, O_CLOEXEC) != 0) return "failed";
  link.open();
  const pid_t child = ::fork();
  if (child == 0) {
    const bool isSent = ::setresuid(user, user, user) == 0 && ::prctl(PR_SET_PDEATHSIG, SIGKILL) == 0 &&
                        link.connect() && link.send(hello()) && link.send(startCall(true)) &&
                        ::write(sent[1], "", 1) == 1;
    if (isSent) ::execl(program.c_str(), program.c_str(), "-", nullptr);
    ::kill(::getpid(), SIGKILL);
  }
  ::close(sent[1]);
  char bytes[2];
  // One that says that all is sent, and then the end, with the execution.
  const bool isSent = ::read(sent[0], bytes, 1) == 1 && ::read(sent[0], bytes, 1) == 0;
  ::close(sent[0]);
  return isSent ? "ok" : "failed";
}

std::string perform(Link& link, const char* path, const std::string& command) {
  std::istringstream words(command);
  std::string verb, argument;
  words >> verb;
  if (verb == "user") {
    uid_t user = 0;
    words >> user;
    return ::setresuid(user, user, user) == 0 ? "ok" : "failed";
  }
  if (verb == "lend") {
    uid_t user = 0;
    words >> user >> argument;
    return lend(link, user, argument);
  }
  words >> argument;
  if (verb == "answer") return readAgreement(link.descriptor()) ? meaningOf(link.readAnswer()) : "closed";
  if (verb == "connect") return connectAnew(link);
  if (verb == "start") return request(link, startCall(argument == "system"));
  if (verb == "stop") return request(link, call("stopRecordingWithHandler"));
  if (verb == "become") {
    ::execl(argument.c_str(), argument.c_str(), path, std::to_string(link.descriptor()).c_str(), nullptr);
  }
  return "failed";
}

}  // namespace

int main(int count, char** arguments) {
  if (std::strcmp(arguments[1], "-") == 0) return ::pause();
  Link link(arguments[1], count > 2 ? std::atoi(arguments[2]) : -1);
  std::puts("runs");
  std::fflush(stdout);
  std::string command;
  for (char next = 0; ::read(kCommands, &next, 1) == 1;) {
    if (next != '\n') {
      command += next;
      continue;
    }
    std::puts(perform(link, arguments[1], command).c_str());
    std::fflush(stdout);
    command.clear();
  }
  return 0;
}
