#include "platform/linux/UserFolder.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <memory>

#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr mode_t kFolderMode = 0700;
constexpr mode_t kFileMode = 0600;
constexpr auto kSameGroup = static_cast<gid_t>(-1);

bool give(const FileDescriptor& file, uid_t user, mode_t mode) {
  return ::fchmod(file.get(), mode) == 0 && ::fchown(file.get(), user, kSameGroup) == 0;
}

/// Only what is this process's user's, and has no other name: that may be elsewhere, where it is not to be given away.
void giveFile(const FileDescriptor& folder, const std::string& name, uid_t user) {
  const FileDescriptor file(
      ::openat(folder.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat info {};
  if (!file.isValid() || ::fstat(file.get(), &info) != 0) return;
  if (!S_ISREG(info.st_mode) || info.st_uid != ::geteuid() || info.st_nlink != 1) return;
  if (!give(file, user, kFileMode)) {
    QV_LOG_ERROR(logs::kPlatform, "\"%s\" cannot be given to user %u", name.c_str(), user);
  }
}

/// The folder last: until then the next one to open it does what is left.
std::optional<Error> giveFolder(const FileDescriptor& folder, const std::string& path, uid_t user) {
  if (user != ::geteuid()) {
    for (const std::string& name : namesIn(folder)) giveFile(folder, name, user);
  }
  return give(folder, user, kFolderMode) ? std::nullopt : std::optional(Error::posix(errno, path));
}

}  // namespace

Result<FileDescriptor> openFolderOfUser(uid_t user, const std::string& path) {
  if (auto error = makeDirectories(std::filesystem::path(path).parent_path())) return *error;
  if (::mkdir(path.c_str(), kFolderMode) != 0 && errno != EEXIST) return Error::posix(errno, path);
  FileDescriptor folder(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  struct stat info {};
  if (!folder.isValid() || ::fstat(folder.get(), &info) != 0) return Error::posix(errno, path);
  if (info.st_uid == ::geteuid()) {
    if (auto error = giveFolder(folder, path, user)) return *error;
  } else if (info.st_uid != user) {
    return Error::posix(EPERM, path + " belongs to user " + std::to_string(info.st_uid));
  }
  return folder;
}

std::vector<std::string> namesIn(const FileDescriptor& directory) {
  std::vector<std::string> names;
  // With a place of its own, so that a second look begins at the first entry again.
  const int copy = ::openat(directory.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  const std::unique_ptr<DIR, int (*)(DIR*)> list(copy >= 0 ? ::fdopendir(copy) : nullptr, &::closedir);
  if (!list && copy >= 0) ::close(copy);
  while (const dirent* entry = list ? ::readdir(list.get()) : nullptr) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..") names.push_back(name);
  }
  return names;
}

}  // namespace qv::platform
