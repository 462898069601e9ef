#pragma once

#include <algorithm>
#include <cerrno>
#include <functional>
#include <map>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "platform/mp4/BoxReader.h"
#include "platform/mp4/MovieFile.h"

namespace qv::platform::mp4 {

/// The numbers of four bytes in `content`, a line each: "0*3" are three zeros, "ff:1" is a rest of one byte.
inline std::string numbers(std::span<const uint8_t> content) {
  std::ostringstream text;
  ByteReader in(content);
  for (size_t zeros = 0; in.left() > 0;) {
    const size_t size = std::min<size_t>(4, in.left());
    const uint64_t value = in.number(size);
    if (value == 0 && size == 4 && ++zeros > 0 && in.left() > 0) continue;
    if (zeros > 0) text << "0*" << std::exchange(zeros, 0) << '\n';
    if (value != 0 || size != 4)
      text << std::hex << value << std::dec << (size == 4 ? "" : ":" + std::to_string(size)) << '\n';
  }
  return text.str();
}

/// A word a line, so that a difference is easily seen.
inline std::string words(const std::string& text) {
  std::string lines;
  std::istringstream in(text);
  for (std::string word; in >> word;) lines += word + '\n';
  return lines;
}

/// The boxes in `bytes`, by ISO/IEC 14496-12: of each its name, its numbers, and the boxes in it between braces.
inline std::string layoutOf(std::span<const uint8_t> bytes) {
  static const std::map<std::string, size_t> kBoxesAfter = {
      {"moov", 0}, {"trak", 0}, {"edts", 0}, {"mdia", 0}, {"minf", 0}, {"dinf", 0},  {"stbl", 0},
      {"mvex", 0}, {"moof", 0}, {"traf", 0}, {"dref", 8}, {"stsd", 8}, {"mp4a", 28}, {"avc1", 78}};
  std::string text;
  while (const auto box = takeBox(bytes)) {
    const std::string name(box->whole.begin() + 4, box->whole.begin() + 8);
    const auto parent = kBoxesAfter.find(name);
    const size_t own = std::min(box->content.size(), parent == kBoxesAfter.end() ? SIZE_MAX : parent->second);
    text += name + '\n' + numbers(box->content.first(own));
    if (parent != kBoxesAfter.end()) text += "{\n" + layoutOf(box->content.subspan(own)) + "}\n";
  }
  return words(text + numbers(bytes));
}

/// A disk in memory, which tells what it was asked for.
///
/// Threading: as the file; read it when that is idle.
struct Disk {
  std::vector<uint8_t> bytes;
  std::string calls;              ///< w: written, also in several steps; t: truncated; s: synced
  size_t failsAt = SIZE_MAX;      ///< the step that fails, once, with ENOSPC
  std::function<void()> atFirst;  ///< called before the first step
  std::function<void()> atSync;
  size_t steps = 0;
};

/// Writes some bytes at a time, with an interruption between.
///
/// Threading: confined to one thread at a time.
class MemoryFile final : public MovieFile {
 public:
  explicit MemoryFile(Disk& disk) : disk_(disk) {}
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override {
    if (isInterrupted_ = !isInterrupted_; isInterrupted_) return -EINTR;
    if (disk_.calls.empty() || disk_.calls.back() != 'w' || offset != next_) disk_.calls += 'w';
    if (fails()) return -ENOSPC;
    bytes = bytes.first(std::min<size_t>(bytes.size(), 700));
    next_ = offset + bytes.size();
    disk_.bytes.resize(std::max(disk_.bytes.size(), next_));
    std::copy(bytes.begin(), bytes.end(), disk_.bytes.begin() + static_cast<std::ptrdiff_t>(offset));
    return std::ssize(bytes);
  }
  int truncate(uint64_t size) override {
    disk_.calls += 't';
    disk_.bytes.resize(size);
    return 0;
  }
  int sync() override {
    disk_.calls += 's';
    if (disk_.atSync) disk_.atSync();
    return fails() ? ENOSPC : 0;
  }
  int close() override { return 0; }

 private:
  bool fails() {
    if (disk_.steps == 0 && disk_.atFirst) disk_.atFirst();
    return disk_.steps++ == disk_.failsAt;
  }

  Disk& disk_;
  bool isInterrupted_ = false;
  uint64_t next_ = 0;
};

}  // namespace qv::platform::mp4
