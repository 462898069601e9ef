#include "platform/linux/FileCopy.h"

#include <fcntl.h>
#include <stdio.h>
#include <sys/random.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <utility>

namespace qv::platform {
namespace {

constexpr mode_t kMode = 0600;
constexpr size_t kChunk = size_t{64} << 20;  // bytes in one call

/// Hard to foresee, for a directory in which others write too.
std::string hiddenName() {
  uint64_t number = 0;
  // A kernel that refuses leaves a name that can be foreseen, but another one each time.
  if (::getrandom(&number, sizeof number, 0) < 0) {
    number = static_cast<uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
  }
  return kUnfinishedCopyPrefix + std::to_string(number);
}

/// A new file in a directory, under a hidden name. It goes again, unless it was given its name.
class Unfinished {
 public:
  explicit Unfinished(const FileDescriptor& directory) : directory_(directory.get()) {
    constexpr int kFlags = O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    do {
      name_ = hiddenName();
      file_ = FileDescriptor(::openat(directory_, name_.c_str(), kFlags, kMode));
    } while (!file_.isValid() && errno == EEXIST);
  }
  ~Unfinished() {
    if (file_.isValid() && !name_.empty()) ::unlinkat(directory_, name_.c_str(), 0);
  }
  Unfinished(const Unfinished&) = delete;
  Unfinished& operator=(const Unfinished&) = delete;
  /// Invalid where it could not be made; errno says why.
  const FileDescriptor& file() const { return file_; }
  std::optional<Error> finishAs(const std::string& name) {
    if (auto error = renameExclusively(directory_, name_, name)) return error;
    name_.clear();
    return std::nullopt;
  }
  bool isAt(const std::string& name) const {
    struct stat mine {
    }, found{};
    return ::fstat(file_.get(), &mine) == 0 && ::fstatat(directory_, name.c_str(), &found, AT_SYMLINK_NOFOLLOW) == 0 &&
           mine.st_dev == found.st_dev && mine.st_ino == found.st_ino;
  }

 private:
  const int directory_;
  std::string name_;
  FileDescriptor file_;
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

/// What belongs to this process's user already needs no right to be given away.
std::optional<Error> giveTo(uid_t owner, const FileDescriptor& file) {
  if (owner == ::geteuid() || ::fchown(file.get(), owner, static_cast<gid_t>(-1)) == 0) return std::nullopt;
  return Error::posix(errno, "the owner of a copy");
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

std::optional<Error> renameExclusively(int directory, const std::string& source, const std::string& destination) {
  const char* const from = source.c_str();
  const char* const to = destination.c_str();
  if (::renameat2(directory, from, directory, to, RENAME_NOREPLACE) == 0) return std::nullopt;
  if (errno != EINVAL && errno != ENOSYS) return Error::posix(errno, destination);
  // A file system without exclusive renames: a hard link is as exclusive.
  if (::linkat(directory, from, directory, to, 0) == 0) {
    ::unlinkat(directory, from, 0);
    return std::nullopt;
  }
  if (errno != EPERM && errno != EOPNOTSUPP) return Error::posix(errno, destination);
  // A directory, or a file system without links either.
  struct stat info {};
  if (::fstatat(directory, to, &info, AT_SYMLINK_NOFOLLOW) == 0) return Error::posix(EEXIST, destination);
  if (::renameat(directory, from, directory, to) == 0) return std::nullopt;
  return Error::posix(errno, destination);
}

Result<std::string> copyIntoDirectory(const FileDescriptor& source, const FileDescriptor& directory, uid_t owner,
                                      const std::function<std::string(int)>& nameForAttempt) {
  Unfinished copy(directory);
  if (!copy.file().isValid()) return Error::posix(errno, "copy");
  if (auto error = copyContent(source.get(), copy.file().get())) return *error;
  if (auto error = giveTo(owner, copy.file())) return *error;
  if (::fsync(copy.file().get()) != 0) return Error::posix(errno, "copy");
  for (int attempt = 0;; ++attempt) {
    const std::string name = nameForAttempt(attempt);
    if (name.empty()) return Error::posix(EEXIST, "copy");
    const auto error = copy.finishAs(name);
    if (!error) {
      (void)::fsync(directory.get());
      return copy.isAt(name) ? Result<std::string>(name) : Error::posix(ESTALE, name);
    }
    if (error->code != EEXIST) return *error;
  }
}

}  // namespace qv::platform
