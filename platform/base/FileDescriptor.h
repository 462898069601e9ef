#pragma once

#include <unistd.h>

#include <memory>
#include <utility>

namespace qv::platform {

/// Sole owner of one file descriptor; closes it when destroyed.
///
/// Threading: movable between threads, not shared.
class FileDescriptor {
 public:
  FileDescriptor() = default;
  explicit FileDescriptor(int fd) : fd_(fd) {}
  FileDescriptor(FileDescriptor&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    reset(std::exchange(other.fd_, -1));
    return *this;
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  ~FileDescriptor() { reset(); }

  [[nodiscard]] int get() const { return fd_; }
  [[nodiscard]] bool isValid() const { return fd_ >= 0; }
  [[nodiscard]] int release() { return std::exchange(fd_, -1); }
  void reset(int fd = -1) {
    if (fd_ >= 0) ::close(fd_);
    fd_ = fd;
  }

 private:
  int fd_ = -1;
};

/// A descriptor that several holders share, e.g. inside a copied Value.
using SharedFileDescriptor = std::shared_ptr<const FileDescriptor>;

inline SharedFileDescriptor shareFileDescriptor(FileDescriptor fd) {
  return std::make_shared<const FileDescriptor>(std::move(fd));
}

}  // namespace qv::platform
