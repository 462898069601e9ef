#pragma once

#include <chrono>
#include <functional>

#include "platform/linux/ContainerUse.h"
#include "platform/linux/ExtensionLaunch.h"
#include "platform/process/SpawnedProcess.h"

namespace qv::platform {

/// What the daemon does for an extension's process while it runs: it takes its output to its log, no faster than a disk
/// likes, and counts its container every few seconds. A process over the bounds of its container, or one whose guard
/// has gone, is killed. A container that was over them at the start may not grow; beyond twice the bound it is the end
/// at once.
///
/// Threading: one thread, which waits in it.
class ExtensionWatch {
 public:
  /// All are borrowed. `willKill` is told why.
  ExtensionWatch(const SpawnedProcess& process, const SpawnedProcess& guard, ExtensionLaunch& launch,
                 const std::function<void(const Error&)>& willKill);
  /// The status as of waitpid.
  int waitForEnd();

 private:
  using Clock = std::chrono::steady_clock;

  void countContainer();
  void takeOutput();
  void takeAllOutput();
  /// Whether there was any.
  bool takeOneOutput();
  void kill(const Error& why);

  const SpawnedProcess& process_;
  const SpawnedProcess& guard_;
  ExtensionLaunch& launch_;
  const std::function<void(const Error&)>& willKill_;
  ContainerUse bound_;
  Clock::time_point nextCount_;
  Clock::time_point nextOutput_;
  bool isKilled_ = false;
};

}  // namespace qv::platform
