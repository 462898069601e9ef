#pragma once

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdint>
#include <optional>
#include <span>
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
  [[nodiscard]] uint64_t size() const { return size_; }

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

  /// The first box of this type among those in `parent`.
  [[nodiscard]] std::optional<FileBox> childOf(const FileBox& parent, uint32_t type) const {
    uint64_t offset = parent.offset + parent.headSize;
    while (offset < parent.end()) {
      const auto box = at(offset);
      if (!box || box->end() > parent.end()) return std::nullopt;
      if (box->type == type) return box;
      offset = box->end();
    }
    return std::nullopt;
  }

  /// Its bytes, head included; empty when they cannot be read.
  [[nodiscard]] std::vector<uint8_t> read(const FileBox& box) const {
    return box.size > kMaximumSize ? std::vector<uint8_t>() : read(box.offset, box.size);
  }

  /// These bytes; empty where not all of them can be read.
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

  /// Where this box type stands first as four bytes within [from, to), at any place; nothing where it does not.
  [[nodiscard]] std::optional<uint64_t> find(uint32_t type, uint64_t from, uint64_t to) const {
    const std::array<uint8_t, 4> code = {static_cast<uint8_t>(type >> 24), static_cast<uint8_t>(type >> 16),
                                         static_cast<uint8_t>(type >> 8), static_cast<uint8_t>(type)};
    to = std::min(to, size_);
    while (from < to && to - from >= code.size()) {
      const auto bytes = read(from, std::min(kSearchStep, to - from));
      if (bytes.empty()) return std::nullopt;
      const auto found = std::search(bytes.begin(), bytes.end(), code.begin(), code.end());
      if (found != bytes.end()) return from + static_cast<uint64_t>(found - bytes.begin());
      from += bytes.size() - (code.size() - 1);
    }
    return std::nullopt;
  }

 private:
  static constexpr uint64_t kSearchStep = 1u << 20;

  const int fd_;
  const uint64_t size_;
};

}  // namespace qv::platform::mp4
