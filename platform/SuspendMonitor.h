#pragma once

#include <chrono>
#include <functional>
#include <memory>

namespace qv::platform {

/// What to do around the device's sleep. Called on a thread of the monitor's, and must not block it.
struct SuspendHandlers {
  /// The device is about to sleep. While `hold` lives it waits with that, for a few seconds at most.
  std::function<void(std::shared_ptr<void> hold)> willSleep;
  /// It is awake again, or did not fall asleep after all; for how long it slept.
  std::function<void(std::chrono::nanoseconds asleep)> didWake;
};

/// Tells of the device's sleep while a keep-alive transaction is open; nothing else that the daemon does
/// is concerned by it.
///
/// Threading: thread-safe.
class SuspendMonitor {
 public:
  virtual ~SuspendMonitor() = default;
  /// Replaces the former handlers. An announcement that is on its way may still reach those.
  virtual void setHandlers(SuspendHandlers handlers) = 0;
};

}  // namespace qv::platform
