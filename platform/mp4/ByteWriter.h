#pragma once

#include <cstdint>
#include <span>
#include <vector>

namespace qv::platform::mp4 {

/// Appends big-endian numbers to a growing buffer.
///
/// Threading: confined to one thread.
class ByteWriter {
 public:
  void u8(uint64_t v) { big(v, 1); }
  void u16(uint64_t v) { big(v, 2); }
  void u24(uint64_t v) { big(v, 3); }
  void u32(uint64_t v) { big(v, 4); }
  void u64(uint64_t v) { big(v, 8); }
  void zeros(size_t count) { bytes_.insert(bytes_.end(), count, 0); }
  void code(const char (&fourCC)[5]) { bytes_.insert(bytes_.end(), fourCC, fourCC + 4); }
  void append(std::span<const uint8_t> bytes) { bytes_.insert(bytes_.end(), bytes.begin(), bytes.end()); }
  void patch32(size_t at, uint64_t v) {
    for (size_t i = 0; i < 4; ++i) bytes_[at + i] = static_cast<uint8_t>(v >> (8 * (3 - i)));
  }
  void reserve(size_t size) { bytes_.reserve(size); }
  [[nodiscard]] size_t size() const { return bytes_.size(); }
  [[nodiscard]] std::span<const uint8_t> bytes() const { return bytes_; }
  [[nodiscard]] std::vector<uint8_t> take() { return std::move(bytes_); }

 private:
  void big(uint64_t v, int count) {
    for (int shift = 8 * (count - 1); shift >= 0; shift -= 8) bytes_.push_back(static_cast<uint8_t>(v >> shift));
  }
  std::vector<uint8_t> bytes_;
};

/// A box: its size is filled in when the scope ends.
///
/// Threading: confined to one thread.
class BoxScope {
 public:
  BoxScope(ByteWriter& out, const char (&fourCC)[5]) : out_(out), start_(out.size()) {
    out_.u32(0);
    out_.code(fourCC);
  }
  /// A full box, with version and flags.
  BoxScope(ByteWriter& out, const char (&fourCC)[5], uint8_t version, uint32_t flags) : BoxScope(out, fourCC) {
    out_.u8(version);
    out_.u24(flags);
  }
  ~BoxScope() { out_.patch32(start_, out_.size() - start_); }
  BoxScope(const BoxScope&) = delete;
  BoxScope& operator=(const BoxScope&) = delete;

 private:
  ByteWriter& out_;
  const size_t start_;
};

}  // namespace qv::platform::mp4
