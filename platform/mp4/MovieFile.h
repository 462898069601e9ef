#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "platform/base/Error.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform::mp4 {

/// A file that a movie is written into: the few operations that can fail, so that a test can make
/// them fail.
///
/// Threading: confined to one thread at a time.
class MovieFile {
 public:
  virtual ~MovieFile() = default;
  /// Writes at `offset` with one system call; returns how many bytes went out (maybe fewer), or
  /// the negated errno.
  virtual int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) = 0;
  /// 0 or an errno.
  virtual int truncate(uint64_t size) = 0;
  /// Waits until all that was written has reached the disk; 0 or an errno.
  virtual int sync() = 0;
  /// Ends the use of the file, and tells what only shows then; 0 or an errno.
  virtual int close() = 0;
};

/// A file on disk.
///
/// Threading: confined to one thread at a time.
class DiskMovieFile final : public MovieFile {
 public:
  /// A new file, for this process's user alone; EEXIST where there is one already. It is locked (flock) until it is
  /// closed.
  static Result<std::unique_ptr<MovieFile>> create(const std::string& path);
  /// `path`: where the file was made, and must be until it is closed; empty where that does not matter.
  explicit DiskMovieFile(FileDescriptor fd, std::string path = {}) : fd_(std::move(fd)), path_(std::move(path)) {}
  /// Gives the lock back, rather than to leave that to the last close: whoever lists the descriptors of this process
  /// holds each of them for a moment.
  ~DiskMovieFile() override;

  [[nodiscard]] int fd() const { return fd_.get(); }
  int64_t writeAt(std::span<const uint8_t> bytes, uint64_t offset) override;
  int truncate(uint64_t size) override;
  /// ENOENT where the file was removed meanwhile: nobody will find what goes there.
  int sync() override;
  /// ENOENT where the file was removed, moved, or another one is in its place.
  int close() override;

 private:
  [[nodiscard]] int checkPlace() const;

  FileDescriptor fd_;
  const std::string path_;
};

/// Writes all of `bytes` at `offset`, going on after short writes and interruptions.
std::optional<Error> writeFully(MovieFile& file, std::span<const uint8_t> bytes, uint64_t offset);

}  // namespace qv::platform::mp4
