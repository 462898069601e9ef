#include "platform/linux/PosixFileSystem.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

#include "platform/linux/FileCopy.h"
#include "platform/linux/SmallFile.h"

namespace qv::platform {

namespace fs = std::filesystem;

namespace {

Date dateFrom(const struct statx_timestamp& time) {
  return {static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9};
}

std::optional<Error> moveByCopy(const std::string& source, const std::string& destination) {
  const auto file = openRegularFile(source);
  if (!file) return file.error().code == EINVAL ? Error::posix(EXDEV, source) : file.error();
  const size_t slash = destination.rfind('/');
  const std::string into = destination.substr(0, slash);
  const FileDescriptor directory(::open(into.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory.isValid()) return Error::posix(errno, into);
  const std::string name = destination.substr(slash + 1);
  const auto copied = copyIntoDirectory(file.value(), directory, ::geteuid(),
                                        [&](int attempt) { return attempt == 0 ? name : std::string(); });
  if (!copied) return copied.error();
  if (::unlink(source.c_str()) != 0) return Error::posix(errno, source);
  return std::nullopt;
}

}  // namespace

bool PosixFileSystem::itemExists(const std::string& path) {
  struct stat info {};
  return ::lstat(path.c_str(), &info) == 0;
}

std::optional<Error> PosixFileSystem::createDirectory(const std::string& path) {
  if (::mkdir(path.c_str(), 0700) == 0) return std::nullopt;
  return Error::posix(errno, path);
}

std::optional<Error> PosixFileSystem::checkWritable(const std::string& directory) {
  const FileDescriptor nameless(::open(directory.c_str(), O_TMPFILE | O_WRONLY | O_CLOEXEC, 0600));
  if (nameless.isValid()) return std::nullopt;
  // Not every file system has files without names. The rights alone tell less: root has them all.
  if (errno != EOPNOTSUPP && errno != EISDIR) return Error::posix(errno, directory);
  if (::access(directory.c_str(), W_OK | X_OK) == 0) return std::nullopt;
  return Error::posix(errno, directory);
}

std::optional<Error> PosixFileSystem::makePrivate(const std::string& path) {
  struct stat info {};
  if (::lstat(path.c_str(), &info) != 0) return Error::posix(errno, path);
  if (S_ISLNK(info.st_mode)) return std::nullopt;
  const mode_t mode = S_ISDIR(info.st_mode) ? 0700 : 0600;
  const uid_t self = ::geteuid();
  if (info.st_uid != self && ::lchown(path.c_str(), self, ::getegid()) != 0) return Error::posix(errno, path);
  if ((info.st_mode & 07777) == mode) return std::nullopt;
  if (::fchmodat(AT_FDCWD, path.c_str(), mode, AT_SYMLINK_NOFOLLOW) != 0) return Error::posix(errno, path);
  return std::nullopt;
}

Result<std::vector<std::string>> PosixFileSystem::contentsOfDirectory(const std::string& path) {
  std::vector<std::string> names;
  std::error_code failure;
  for (fs::directory_iterator entry(path, failure), end; !failure && entry != end; entry.increment(failure)) {
    names.push_back(entry->path().filename());
  }
  if (failure) return Error::posix(failure.value(), path);
  return names;
}

Result<FileAttributes> PosixFileSystem::attributesOfItem(const std::string& path) {
  struct statx info {};
  constexpr unsigned kWanted = STATX_TYPE | STATX_SIZE | STATX_MTIME | STATX_BTIME;
  if (::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, kWanted, &info) != 0) return Error::posix(errno, path);
  FileAttributes attributes;
  attributes.size = info.stx_size;
  attributes.modificationDate = dateFrom(info.stx_mtime);
  const bool hasBirthTime = (info.stx_mask & STATX_BTIME) != 0;
  attributes.creationDate = hasBirthTime ? dateFrom(info.stx_btime) : attributes.modificationDate;
  attributes.isDirectory = S_ISDIR(info.stx_mode);
  return attributes;
}

std::optional<Error> PosixFileSystem::removeItem(const std::string& path) {
  if (::unlink(path.c_str()) == 0) return std::nullopt;
  if (errno != EISDIR) return Error::posix(errno, path);
  std::error_code failure;
  fs::remove_all(path, failure);
  if (failure) return Error::posix(failure.value(), path);
  return std::nullopt;
}

std::optional<Error> PosixFileSystem::moveItem(const std::string& source, const std::string& destination) {
  const auto error = renameExclusively(AT_FDCWD, source, destination);
  return error && error->code == EXDEV ? moveByCopy(source, destination) : error;
}

Result<uint64_t> PosixFileSystem::freeSizeOfFileSystem(const std::string& path) {
  std::error_code failure;
  const fs::space_info space = fs::space(path, failure);
  if (failure) return Error::posix(failure.value(), path);
  return space.available;
}

Result<std::string> PosixFileSystem::readFile(const std::string& path) { return readSmallFile(path); }

Result<FileDescriptor> PosixFileSystem::openFile(const std::string& path) { return openRegularFile(path); }

}  // namespace qv::platform
