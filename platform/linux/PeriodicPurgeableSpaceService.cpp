#include "platform/linux/PeriodicPurgeableSpaceService.h"

#include <chrono>
#include <utility>

#include "platform/Log.h"

namespace qv::platform {

PeriodicPurgeableSpaceService::PeriodicPurgeableSpaceService(TimerService& timers, Executor& executor)
    : timers_(timers), executor_(executor) {}

void PeriodicPurgeableSpaceService::registerCallbacks(const std::string& serviceName,
                                                      PurgeableSpaceCallbacks callbacks) {
  const auto shared = std::make_shared<const PurgeableSpaceCallbacks>(std::move(callbacks));
  const auto call = [shared, serviceName] {
    if (!shared->periodic) return;
    const int64_t freed = shared->periodic(0, 0);
    QV_LOG_INFO(logs::kPlatform, "%s freed %lld bytes", serviceName.c_str(), static_cast<long long>(freed));
  };
  auto timer = timers_.every(std::chrono::hours(24), [&executor = executor_, call] { executor.post(call); });
  std::lock_guard lock(mutex_);
  registrations_[serviceName] = {shared, std::move(timer)};
}

}  // namespace qv::platform
