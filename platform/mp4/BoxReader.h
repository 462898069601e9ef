#pragma once

#include <cstdint>
#include <cstring>
#include <optional>
#include <span>

namespace qv::platform::mp4 {

/// Reads big-endian numbers off bytes that may be anything; what lies beyond the end reads as zero
/// and is remembered.
///
/// Threading: confined to one thread.
class ByteReader {
 public:
  explicit ByteReader(std::span<const uint8_t> bytes) : bytes_(bytes) {}
  uint64_t number(size_t size) {
    uint64_t value = 0;
    if (size > left()) {
      failed_ = true;
      at_ = bytes_.size();
      return 0;
    }
    for (size_t i = 0; i < size; ++i) value = value << 8 | bytes_[at_++];
    return value;
  }
  uint32_t u32() { return static_cast<uint32_t>(number(4)); }
  uint64_t u64() { return number(8); }
  void skip(size_t size) {
    failed_ = failed_ || size > left();
    at_ = size > left() ? bytes_.size() : at_ + size;
  }
  [[nodiscard]] size_t left() const { return bytes_.size() - at_; }
  [[nodiscard]] bool failed() const { return failed_; }
  [[nodiscard]] std::span<const uint8_t> rest() const { return bytes_.subspan(at_); }

 private:
  std::span<const uint8_t> bytes_;
  size_t at_ = 0;
  bool failed_ = false;
};

/// The content of one box.
struct BoxView {
  uint32_t type = 0;
  std::span<const uint8_t> whole;
  std::span<const uint8_t> content;
};

constexpr uint32_t boxType(const char (&code)[5]) {
  return uint32_t(uint8_t(code[0])) << 24 | uint32_t(uint8_t(code[1])) << 16 | uint32_t(uint8_t(code[2])) << 8 |
         uint32_t(uint8_t(code[3]));
}

/// Takes the next box off `bytes`; nothing where there is no whole one.
inline std::optional<BoxView> takeBox(std::span<const uint8_t>& bytes) {
  ByteReader in(bytes);
  const uint64_t size = in.u32();
  const uint32_t type = in.u32();
  if (in.failed() || size < 8 || size > bytes.size()) return std::nullopt;
  BoxView box{type, bytes.first(size), bytes.subspan(8, size - 8)};
  bytes = bytes.subspan(size);
  return box;
}

/// The content of the first box of this type among those in `bytes`; empty where there is none.
inline std::span<const uint8_t> findBox(std::span<const uint8_t> bytes, uint32_t type) {
  while (auto box = takeBox(bytes)) {
    if (box->type == type) return box->content;
  }
  return {};
}

}  // namespace qv::platform::mp4
