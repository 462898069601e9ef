#include "platform/linux/ContainerUse.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>

#include <memory>
#include <string_view>
#include <utility>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/ExtensionBounds.h"

namespace qv::platform {
namespace {

constexpr uint64_t kBlock = 512;  // of st_blocks, whatever the file system's

/// Calls `visit` with the open directory and a name; where it returns false, no more.
template <typename Visit>
void forEachEntry(FileDescriptor directory, const Visit& visit) {
  struct Close {
    void operator()(DIR* open) const { ::closedir(open); }
  };
  const std::unique_ptr<DIR, Close> entries(::fdopendir(directory.get()));
  if (!entries) return;
  (void)directory.release();
  while (const dirent* entry = ::readdir(entries.get())) {
    const std::string_view name = entry->d_name;
    if (name != "." && name != ".." && !visit(::dirfd(entries.get()), entry->d_name)) return;
  }
}

/// Threading: one thread.
class Count {
 public:
  explicit Count(const FileDescriptor& container) {
    struct stat info {};
    if (::fstat(container.get(), &info) == 0) device_ = info.st_dev;
  }
  void addDirectory(FileDescriptor directory, int depth) {
    if (depth > extensionbounds::kContainerDepth) {
      use_.entries += extensionbounds::kContainerEntries;
      return;
    }
    forEachEntry(std::move(directory), [&](int parent, const char* name) {
      struct stat info {};
      if (::fstatat(parent, name, &info, AT_SYMLINK_NOFOLLOW) != 0) return true;
      add(info);
      if (S_ISDIR(info.st_mode)) addDirectory(open(parent, name), depth + 1);
      return use_.entries <= 2 * extensionbounds::kContainerEntries;
    });
  }
  /// On the container's disk; what lies in memory is not counted here.
  void addFilesWithoutName(const std::string& descriptors) {
    forEachEntry(open(AT_FDCWD, descriptors.c_str()), [&](int parent, const char* name) {
      struct stat info {};
      const bool isHere = ::fstatat(parent, name, &info, 0) == 0;
      if (isHere && S_ISREG(info.st_mode) && info.st_nlink == 0 && info.st_dev == device_) add(info);
      return true;
    });
  }
  static FileDescriptor open(int parent, const char* name) {
    return FileDescriptor(::openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  }
  [[nodiscard]] ContainerUse use() const { return use_; }

 private:
  void add(const struct stat& info) {
    use_.bytes += static_cast<uint64_t>(info.st_blocks) * kBlock;
    ++use_.entries;
  }

  dev_t device_ = 0;
  ContainerUse use_;
};

}  // namespace

ContainerUse countContainerUse(const std::string& container, pid_t process) {
  FileDescriptor directory = Count::open(AT_FDCWD, container.c_str());
  Count count(directory);
  count.addDirectory(std::move(directory), 1);
  count.addFilesWithoutName("/proc/" + std::to_string(process) + "/fd");
  return count.use();
}

}  // namespace qv::platform
