#pragma once

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <optional>
#include <vector>

#include "platform/mp4/BoxReader.h"

namespace qv::platform::mp4 {

/// A box of the file, its content not read yet.
struct FileBox {
  uint32_t type = 0;
  uint64_t offset = 0;
  uint64_t headSize = 8;
  uint64_t size = 0;
  [[nodiscard]] uint64_t end() const { return offset + size; }
};

/// Walks over the boxes of an open file (borrowed).
///
/// Threading: confined to one thread.
class FileBoxes {
 public:
  /// Heads of fragments take some kilobytes; a box of media descriptions that claims more than this is damaged.
  static constexpr uint64_t kMaximumSize = 16u << 20;

  FileBoxes(int fd, uint64_t size) : fd_(fd), size_(size) {}

  /// The box at `offset`; nothing where no whole one is.
  [[nodiscard]] std::optional<FileBox> at(uint64_t offset) const {
    const auto head = read(offset, std::min<uint64_t>(16, size_ - std::min(size_, offset)));
    ByteReader in(head);
    FileBox box;
    box.offset = offset;
    box.size = in.u32();
    box.type = in.u32();
    if (box.size == 1) {
      box.size = in.u64();
      box.headSize = 16;
    }
    if (in.failed() || box.size < box.headSize || box.size > size_ - offset) return std::nullopt;
    return box;
  }

  /// Its bytes, head included; empty when they cannot be read.
  [[nodiscard]] std::vector<uint8_t> read(const FileBox& box) const {
    return box.size > kMaximumSize ? std::vector<uint8_t>() : read(box.offset, box.size);
  }

 private:
  [[nodiscard]] std::vector<uint8_t> read(uint64_t offset, uint64_t count) const {
    std::vector<uint8_t> bytes(count);
    size_t done = 0;
    while (done < count) {
      const ssize_t got = ::pread(fd_, bytes.data() + done, count - done, static_cast<off_t>(offset + done));
      if (got < 0 && errno == EINTR) continue;
      if (got <= 0) return {};
      done += static_cast<size_t>(got);
    }
    return bytes;
  }

  const int fd_;
  const uint64_t size_;
};

}  // namespace qv::platform::mp4
