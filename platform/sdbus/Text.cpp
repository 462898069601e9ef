#include "platform/sdbus/Text.h"

#include <cstdint>

namespace qv::platform::sdbus {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";

/// The length of the valid sequence at the start of `text`, or 0.
size_t sequenceLength(std::string_view text) {
  const auto byte = [&](size_t i) { return static_cast<uint8_t>(text[i]); };
  const uint8_t first = byte(0);
  if (first < 0x80) return first == 0 ? 0 : 1;
  const size_t length = first >= 0xC2 && first <= 0xDF ? 2 : first >= 0xE0 && first <= 0xEF ? 3 : 4;
  if (first < 0xC2 || first > 0xF4 || text.size() < length) return 0;
  for (size_t i = 1; i < length; ++i) {
    if ((byte(i) & 0xC0) != 0x80) return 0;
  }
  // Overlong forms, surrogates, and what lies beyond U+10FFFF.
  if (first == 0xE0 && byte(1) < 0xA0) return 0;
  if (first == 0xED && byte(1) > 0x9F) return 0;
  if (first == 0xF0 && byte(1) < 0x90) return 0;
  if (first == 0xF4 && byte(1) > 0x8F) return 0;
  return length;
}

}  // namespace

std::string validText(std::string_view text) {
  std::string valid;
  valid.reserve(text.size());
  while (!text.empty()) {
    const size_t length = sequenceLength(text);
    valid += length > 0 ? text.substr(0, length) : kReplacement;
    text.remove_prefix(length > 0 ? length : 1);
  }
  return valid;
}

}  // namespace qv::platform::sdbus
