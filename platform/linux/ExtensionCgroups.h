#pragma once

#include <sys/types.h>

#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/base/Error.h"

namespace qv::platform {

/// One cgroup with the bounds of ExtensionBounds.h. Destroying it kills what still runs in it, and removes it.
///
/// Threading: one thread at a time. Blocking.
class ExtensionCgroup {
 public:
  explicit ExtensionCgroup(std::string path) : path_(std::move(path)) {}
  ~ExtensionCgroup();
  ExtensionCgroup(const ExtensionCgroup&) = delete;
  ExtensionCgroup& operator=(const ExtensionCgroup&) = delete;

  std::optional<Error> add(pid_t process);

 private:
  const std::string path_;
};

/// This process's own cgroup (version 2), where that was delegated to it (`Delegate=yes` of its unit). With the first
/// that is made it moves to a leaf of its own, `daemon`, for processes may only be in leaves, and one log line
/// tells what there is to bound with.
///
/// Threading: thread-safe, blocking.
class ExtensionCgroups {
 public:
  /// Of this process; empty where there is none that was delegated.
  static std::string findDelegated();

  /// Where there is none, none are made.
  explicit ExtensionCgroups(std::string delegated = findDelegated()) : delegated_(std::move(delegated)) {}
  /// None where none can be made.
  std::unique_ptr<ExtensionCgroup> make();

 private:
  void prepare();
  void moveProcessesToLeaf();
  void switchControllersOn();

  const std::string delegated_;
  std::mutex mutex_;
  bool isPrepared_ = false;
  int made_ = 0;
};

}  // namespace qv::platform
