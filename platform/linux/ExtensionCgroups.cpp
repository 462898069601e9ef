#include "platform/linux/ExtensionCgroups.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <thread>
#include <utility>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/ExtensionBounds.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

std::optional<Error> write(const std::string& path, const std::string& text) {
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CLOEXEC));
  if (!file.isValid()) return Error::posix(errno, path);
  const bool isWritten = ::write(file.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
  return isWritten ? std::nullopt : std::optional(Error::posix(errno, path));
}

/// The service manager's mark. Without it the cgroup may be a whole session's.
bool isDelegated(const std::string& path) {
  char value = '0';
  return (::getxattr(path.c_str(), "user.delegate", &value, 1) == 1 && value == '1') ||
         (::getxattr(path.c_str(), "trusted.delegate", &value, 1) == 1 && value == '1');
}

void setBounds(const std::string& path) {
  using namespace extensionbounds;
  constexpr unsigned kPeriod = 100'000;  // µs
  const uint64_t processors = std::max(1u, std::thread::hardware_concurrency());
  const std::string time = std::to_string(processors * kPeriod * kCgroupProcessorPercent / 100);
  // What is missing was logged once, with the controllers.
  (void)write(path + "/memory.max", std::to_string(kCgroupMemory));
  (void)write(path + "/memory.swap.max", "0");
  (void)write(path + "/memory.oom.group", "1");
  (void)write(path + "/pids.max", std::to_string(kCgroupTasks));
  (void)write(path + "/cpu.weight", std::to_string(kCgroupProcessorWeight));
  (void)write(path + "/cpu.max", time + " " + std::to_string(kPeriod));
}

}  // namespace

std::optional<Error> ExtensionCgroup::add(pid_t process) {
  return write(path_ + "/cgroup.procs", std::to_string(process));
}

ExtensionCgroup::~ExtensionCgroup() {
  (void)write(path_ + "/cgroup.kill", "1");
  if (::rmdir(path_.c_str()) != 0) {
    QV_LOG_ERROR(logs::kExtensions, "%s stays: %s", path_.c_str(), Error::posix(errno).description().c_str());
  }
}

std::string ExtensionCgroups::findDelegated() {
  std::ifstream own("/proc/self/cgroup");
  const std::string unified = "0::";
  for (std::string line; std::getline(own, line);) {
    if (line.compare(0, unified.size(), unified) != 0) continue;
    for (const std::string mount : {"/sys/fs/cgroup", "/sys/fs/cgroup/unified"}) {
      struct statfs info {};
      const std::string path = mount + line.substr(unified.size());
      if (::statfs(path.c_str(), &info) == 0 && info.f_type == CGROUP2_SUPER_MAGIC && isDelegated(path)) return path;
    }
  }
  return {};
}

std::unique_ptr<ExtensionCgroup> ExtensionCgroups::make() {
  const std::lock_guard lock(mutex_);
  if (!std::exchange(isPrepared_, true)) prepare();
  if (delegated_.empty()) return nullptr;
  const std::string path = delegated_ + "/extension-" + std::to_string(::getpid()) + "-" + std::to_string(++made_);
  if (::mkdir(path.c_str(), 0755) != 0) {
    QV_LOG_ERROR(logs::kExtensions, "no cgroup: %s", Error::posix(errno, path).description().c_str());
    return nullptr;
  }
  setBounds(path);
  return std::make_unique<ExtensionCgroup>(path);
}

void ExtensionCgroups::prepare() {
  if (delegated_.empty()) {
    QV_LOG(logs::kExtensions,
           "extensions run without bounds of processor time and of memory in use: no cgroup is delegated");
    return;
  }
  moveProcessesToLeaf();
  switchControllersOn();
}

void ExtensionCgroups::moveProcessesToLeaf() {
  const std::string leaf = delegated_ + "/daemon";
  (void)::mkdir(leaf.c_str(), 0755);
  std::ifstream processes(delegated_ + "/cgroup.procs");
  for (pid_t process = 0; processes >> process;) (void)write(leaf + "/cgroup.procs", std::to_string(process));
}

void ExtensionCgroups::switchControllersOn() {
  std::string missing;
  for (const std::string controller : {"cpu", "memory", "pids"}) {
    if (write(delegated_ + "/cgroup.subtree_control", "+" + controller)) missing += " " + controller;
  }
  QV_LOG(logs::kExtensions, "extensions run in cgroups of their own below %s%s%s", delegated_.c_str(),
         missing.empty() ? "" : ", which lacks:", missing.c_str());
}

}  // namespace qv::platform
