#include "platform/mp4/MovieFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace qv::platform::mp4 {

Result<std::unique_ptr<MovieFile>> DiskMovieFile::create(const std::string& path) {
  FileDescriptor fd(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  if (!fd.isValid()) return Error::posix(errno, path);
  // For whoever looks for unfinished movies. Where the file system has no locks, nobody is kept away.
  (void)::flock(fd.get(), LOCK_EX | LOCK_NB);
  return std::unique_ptr<MovieFile>(std::make_unique<DiskMovieFile>(std::move(fd), path));
}

DiskMovieFile::~DiskMovieFile() { (void)::flock(fd_.get(), LOCK_UN); }

int64_t DiskMovieFile::writeAt(std::span<const uint8_t> bytes, uint64_t offset) {
  const ssize_t written = ::pwrite(fd_.get(), bytes.data(), bytes.size(), static_cast<off_t>(offset));
  return written < 0 ? -errno : written;
}

int DiskMovieFile::truncate(uint64_t size) { return ::ftruncate(fd_.get(), static_cast<off_t>(size)) == 0 ? 0 : errno; }

int DiskMovieFile::sync() {
  struct stat info {};
  if (::fdatasync(fd_.get()) != 0 || ::fstat(fd_.get(), &info) != 0) return errno;
  return info.st_nlink > 0 ? 0 : ENOENT;
}

int DiskMovieFile::checkPlace() const {
  struct stat mine {
  }, found{};
  if (::fstat(fd_.get(), &mine) != 0) return errno;
  if (mine.st_nlink == 0) return ENOENT;
  if (path_.empty()) return 0;
  if (::lstat(path_.c_str(), &found) != 0) return errno;
  return found.st_dev == mine.st_dev && found.st_ino == mine.st_ino ? 0 : ENOENT;
}

int DiskMovieFile::close() {
  if (!fd_.isValid()) return EBADF;
  const int place = checkPlace();
  (void)::flock(fd_.get(), LOCK_UN);
  // Some file systems tell of a lost write only here. Interrupted, the descriptor is closed all the same.
  if (::close(fd_.release()) != 0 && errno != EINTR) return errno;
  return place;
}

std::optional<Error> writeFully(MovieFile& file, std::span<const uint8_t> bytes, uint64_t offset) {
  while (!bytes.empty()) {
    const int64_t written = file.writeAt(bytes, offset);
    if (written == -EINTR) continue;
    // A write of nothing without a reason would loop for ever.
    if (written <= 0) return Error::posix(written == 0 ? EIO : static_cast<int>(-written), "movie file");
    bytes = bytes.subspan(static_cast<size_t>(written));
    offset += static_cast<uint64_t>(written);
  }
  return std::nullopt;
}

}  // namespace qv::platform::mp4
