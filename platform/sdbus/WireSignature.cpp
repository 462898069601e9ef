#include <optional>
#include <string_view>

#include "platform/sdbus/WireHeader.h"

namespace qv::platform::sdbus {
namespace {

constexpr size_t kMaximumSignature = 255;
constexpr int kMaximumDepth = 32;  // of arrays, and of structures
constexpr std::string_view kBasicTypes = "ybnqiuxtdsogh";

/// Reads types off the front of a signature.
///
/// Threading: one thread.
class SignatureReader {
 public:
  explicit SignatureReader(std::string_view text) : rest_(text) {}

  bool readAll() {
    while (!rest_.empty()) {
      if (!readType(0, 0)) return false;
    }
    return true;
  }

 private:
  bool readType(int arrays, int structures) {
    const char type = next();
    if (type == 'v' || isBasic(type)) return true;
    if (type == '(') return structures < kMaximumDepth && readUntil(')', arrays, structures + 1);
    if (type != 'a' || arrays == kMaximumDepth) return false;
    if (!rest_.starts_with('{')) return readType(arrays + 1, structures);
    next();
    return structures < kMaximumDepth && isBasic(next()) && readType(arrays + 1, structures + 1) && next() == '}';
  }

  /// One type at least, and the bracket.
  bool readUntil(char bracket, int arrays, int structures) {
    do {
      if (!readType(arrays, structures)) return false;
    } while (!rest_.empty() && rest_.front() != bracket);
    return next() == bracket;
  }

  static bool isBasic(char type) { return type != '\0' && kBasicTypes.find(type) != std::string_view::npos; }

  char next() {
    if (rest_.empty()) return '\0';
    const char first = rest_.front();
    rest_.remove_prefix(1);
    return first;
  }

  std::string_view rest_;
};

}  // namespace

bool isWireSignature(std::span<const uint8_t> signature) {
  if (signature.size() > kMaximumSignature) return false;
  return SignatureReader({reinterpret_cast<const char*>(signature.data()), signature.size()}).readAll();
}

}  // namespace qv::platform::sdbus
