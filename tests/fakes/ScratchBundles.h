#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "platform/linux/LinuxBundleService.h"
#include "tests/fakes/ScratchDisk.h"

namespace qv::fakes {

/// The bundles of a scratch disk, and processes that the test makes up.
///
/// Threading: thread-safe.
class ScratchBundles final : public platform::BundleService {
 public:
  ScratchBundles(ScratchDisk& disk, const std::string& deviceRoot, platform::Localization& localization)
      : disk_(disk), root_(deviceRoot), bundles_(disk.at(deviceRoot), {}, localization) {}

  /// Writes the Info.json of /Applications/<name>.
  void addApplication(const std::string& name, const std::string& info) {
    disk_.addFile(root_ + "/Applications/" + name + "/Info.json", info);
  }
  /// The same with an identifier, and the name as display name.
  void addNamedApplication(const std::string& name, const std::string& identifier) {
    addApplication(name,
                   R"({"CFBundleIdentifier": ")" + identifier + R"(", "CFBundleDisplayName": ")" + name + R"("})");
  }
  /// A process that runs a file, which is made.
  void setProcess(pid_t pid, const std::string& executablePath, uid_t user = 0) {
    disk_.addFile(root_ + executablePath, {});
    std::lock_guard lock(mutex_);
    processes_[pid] = {disk_.at(root_ + executablePath), user};
  }

  platform::BundleRef bundleAtPath(const std::string& path) override { return bundles_.bundleAtPath(disk_.at(path)); }
  platform::BundleRef bundleWithIdentifier(const std::string& identifier) override {
    return bundles_.bundleWithIdentifier(identifier);
  }
  platform::BundleRef bundleEnclosingExecutable(const std::string& executablePath) override {
    return bundles_.bundleEnclosingExecutable(executablePath);
  }
  std::optional<std::string> executablePathOfProcess(pid_t pid) override {
    std::lock_guard lock(mutex_);
    const auto it = processes_.find(pid);
    return it == processes_.end() ? std::nullopt : std::optional(it->second.executable);
  }
  std::optional<uid_t> userOfProcess(pid_t pid) override {
    std::lock_guard lock(mutex_);
    const auto it = processes_.find(pid);
    return it == processes_.end() ? std::nullopt : std::optional(it->second.user);
  }

 private:
  ScratchDisk& disk_;
  const std::string root_;
  platform::LinuxBundleService bundles_;
  std::mutex mutex_;
  struct Process {
    std::string executable;
    uid_t user;
  };
  std::map<pid_t, Process> processes_;
};

}  // namespace qv::fakes
