#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "platform/Executor.h"
#include "platform/SystemServices.h"
#include "platform/Timer.h"

namespace qv::platform {

/// Calls each registered service's periodic callback once a day, with amount 0 and urgency 0. The
/// other callbacks are kept, but nothing here watches the free space and calls them.
///
/// Threading: thread-safe; callbacks run on the executor. Destroying it ends the calls, apart from one
/// that is on its way.
class PeriodicPurgeableSpaceService final : public PurgeableSpaceService {
 public:
  PeriodicPurgeableSpaceService(TimerService& timers, Executor& executor);
  /// Replaces an earlier registration of the same name.
  void registerCallbacks(const std::string& serviceName, PurgeableSpaceCallbacks callbacks) override;

 private:
  struct Registration {
    std::shared_ptr<const PurgeableSpaceCallbacks> callbacks;
    std::unique_ptr<TimerHandle> timer;
  };

  TimerService& timers_;
  Executor& executor_;
  std::mutex mutex_;
  std::map<std::string, Registration> registrations_;
};

}  // namespace qv::platform
