#include "platform/linux/FileCopy.h"

#include <fcntl.h>
#include <stdio.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

namespace qv::platform {
namespace {

constexpr mode_t kMode = 0644;
constexpr size_t kChunk = size_t{64} << 20;  // bytes in one call

/// Removes a file unless it was let go.
class Unfinished {
 public:
  explicit Unfinished(std::string path) : path_(std::move(path)) {}
  ~Unfinished() {
    if (!path_.empty()) ::unlink(path_.c_str());
  }
  Unfinished(const Unfinished&) = delete;
  Unfinished& operator=(const Unfinished&) = delete;
  const std::string& path() const { return path_; }
  void finish() { path_.clear(); }

 private:
  std::string path_;
};

/// From where both files stand to the end of `from`.
std::optional<Error> copyContent(int from, int to) {
  ssize_t count = 0;
  // Shares the blocks where the file system can. Not every pair of file systems is for this; sendfile copies what is
  // left then, and tells what is wrong otherwise.
  do {
    count = ::copy_file_range(from, nullptr, to, nullptr, kChunk, 0);
  } while (count > 0);
  do {
    count = ::sendfile(to, from, nullptr, kChunk);
  } while (count > 0 || (count < 0 && errno == EINTR));
  return count < 0 ? std::optional(Error::posix(errno, "copy")) : std::nullopt;
}

void flushDirectory(const std::string& path) {
  const FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (directory.isValid()) (void)::fsync(directory.get());
}

}  // namespace

Result<FileDescriptor> openRegularFile(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOFOLLOW | O_NOCTTY));
  if (!file.isValid()) return Error::posix(errno == ELOOP ? EINVAL : errno, path);
  struct stat info {};
  if (::fstat(file.get(), &info) != 0) return Error::posix(errno, path);
  if (!S_ISREG(info.st_mode)) return Error::posix(EINVAL, path + " is not a regular file");
  return file;
}

std::optional<Error> renameExclusively(const std::string& source, const std::string& destination) {
  if (::renameat2(AT_FDCWD, source.c_str(), AT_FDCWD, destination.c_str(), RENAME_NOREPLACE) == 0) return std::nullopt;
  if (errno != EINVAL && errno != ENOSYS) return Error::posix(errno, destination);
  // A file system without exclusive renames: a hard link is as exclusive.
  if (::link(source.c_str(), destination.c_str()) == 0) {
    ::unlink(source.c_str());
    return std::nullopt;
  }
  if (errno != EPERM && errno != EOPNOTSUPP) return Error::posix(errno, destination);
  // A directory, or a file system without links either.
  struct stat info {};
  if (::lstat(destination.c_str(), &info) == 0) return Error::posix(EEXIST, destination);
  if (::rename(source.c_str(), destination.c_str()) == 0) return std::nullopt;
  return Error::posix(errno, destination);
}

Result<std::string> copyIntoDirectory(const FileDescriptor& source, const std::string& directory,
                                      const std::function<std::string(int)>& nameForAttempt) {
  std::string temporary = directory + "/" + kUnfinishedCopyPrefix + "XXXXXX";
  const FileDescriptor copy(::mkostemp(temporary.data(), O_CLOEXEC));
  if (!copy.isValid()) return Error::posix(errno, directory);
  Unfinished unfinished(temporary);
  if (auto error = copyContent(source.get(), copy.get())) return *error;
  if (::fchmod(copy.get(), kMode) != 0 || ::fsync(copy.get()) != 0) return Error::posix(errno, temporary);
  for (int attempt = 0;; ++attempt) {
    const std::string name = nameForAttempt(attempt);
    if (name.empty()) return Error::posix(EEXIST, directory);
    const auto error = renameExclusively(temporary, directory + "/" + name);
    if (!error) {
      unfinished.finish();
      flushDirectory(directory);
      return name;
    }
    if (error->code != EEXIST) return *error;
  }
}

}  // namespace qv::platform
