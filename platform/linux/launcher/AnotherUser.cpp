#include "platform/linux/launcher/AnotherUser.h"

#include <dirent.h>
#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <string_view>
#include <system_error>

namespace qv::platform::launcher {
namespace {

void check(long result, const std::string& what) {
  if (result < 0) throw std::system_error(errno, std::generic_category(), what);
}

struct CloseDirectory {
  void operator()(DIR* directory) const { ::closedir(directory); }
};

/// Another process of the extension may be changing what lies here meanwhile: nothing is reached but through open
/// directories, no link is followed, and what is gone is gone.
void giveEntriesTo(int directory, uid_t user) {
  const std::unique_ptr<DIR, CloseDirectory> entries(::fdopendir(directory));
  if (!entries) {
    ::close(directory);
    return;
  }
  while (const dirent* entry = ::readdir(entries.get())) {
    const std::string_view name = entry->d_name;
    struct stat info {};
    if (name == "." || name == ".." || ::fstatat(directory, entry->d_name, &info, AT_SYMLINK_NOFOLLOW) != 0) continue;
    // A second name of a file may be of one elsewhere.
    if (!S_ISDIR(info.st_mode) && info.st_nlink > 1) continue;
    // What it cannot have it cannot write; nothing else depends on it.
    if (info.st_uid != user && ::fchownat(directory, entry->d_name, user, user, AT_SYMLINK_NOFOLLOW) != 0) continue;
    if (!S_ISDIR(info.st_mode)) continue;
    const int inner = ::openat(directory, entry->d_name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (inner >= 0) giveEntriesTo(inner, user);
  }
}

/// The container itself last: where it is the user's already, all that is in it is.
void giveTo(const std::string& directory, uid_t user) {
  const int opened = ::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  check(opened, directory);
  struct stat info {};
  check(::fstat(opened, &info), directory);
  if (info.st_uid != user) {
    giveEntriesTo(::fcntl(opened, F_DUPFD_CLOEXEC, 0), user);
    check(::fchown(opened, user, user), directory);
  }
  check(::fchmod(opened, 0700), directory);
  ::close(opened);
}

void hideAllBut(const std::string& container, const std::string& dataDirectory) {
  check(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "private mounts");
  // Within the new namespace: what belongs to another one cannot be mounted.
  const int kept = ::open(container.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
  check(kept, container);
  constexpr unsigned long kFlags = MS_NOSUID | MS_NODEV | MS_NOEXEC;
  check(::mount("none", dataDirectory.c_str(), "tmpfs", kFlags, "mode=0755,size=64k"), dataDirectory);
  std::filesystem::create_directories(container);
  const std::string source = "/proc/self/fd/" + std::to_string(kept);
  check(::mount(source.c_str(), container.c_str(), nullptr, MS_BIND, nullptr), container);
  check(::mount(nullptr, dataDirectory.c_str(), nullptr, MS_REMOUNT | MS_RDONLY | kFlags, nullptr), dataDirectory);
  ::close(kept);
}

/// What the device leaves open to every user, /tmp and /dev/shm first of all, is closed to this one.
void forbidWriting(const std::string& container) {
  mount_attr readOnly{};
  readOnly.attr_set = MOUNT_ATTR_RDONLY | MOUNT_ATTR_NOSUID;
  const int r = ::mount_setattr(AT_FDCWD, "/", AT_RECURSIVE, &readOnly, sizeof readOnly);
  if (r != 0 && errno == ENOSYS) return;  // Linux before 5.12
  check(r, "read-only mounts");
  mount_attr writable{};
  writable.attr_set = MOUNT_ATTR_NOSUID | MOUNT_ATTR_NODEV | MOUNT_ATTR_NOEXEC;
  writable.attr_clr = MOUNT_ATTR_RDONLY;
  check(::mount_setattr(AT_FDCWD, container.c_str(), 0, &writable, sizeof writable), container);
}

}  // namespace

AnotherUser::AnotherUser(uid_t user, const View& view) : user_(user) {
  giveTo(view.container, user);
  if (::unshare(CLONE_NEWNS) != 0) {
    if (errno == EPERM && view.isOptional) return;
    check(-1, "mount namespace");
  }
  hideAllBut(view.container, view.dataDirectory);
  forbidWriting(view.container);
}

void AnotherUser::become() const {
  check(::setgroups(0, nullptr), "groups");
  check(::setresgid(user_, user_, user_), "group");
  check(::setresuid(user_, user_, user_), "user");
}

void emptyBoundingSet() {
  for (unsigned long capability = 0; ::prctl(PR_CAPBSET_READ, capability, 0, 0, 0) >= 0; ++capability) {
    // Refused to whoever is not root, who has none to drop.
    (void)::prctl(PR_CAPBSET_DROP, capability, 0, 0, 0);
  }
}

void dropCapabilities() {
  (void)::prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_CLEAR_ALL, 0, 0, 0);
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  const __user_cap_data_struct none[2] = {};
  check(::syscall(SYS_capset, &header, none), "capabilities");
}

}  // namespace qv::platform::launcher
