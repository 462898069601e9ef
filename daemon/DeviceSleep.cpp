#include "daemon/DeviceSleep.h"

#include "daemon/QVRecordingManager.h"
#include "platform/threads/Log.h"

namespace qv {

namespace logs = platform::logs;

platform::SuspendHandlers handlersOfDeviceSleep(const std::shared_ptr<QVRecordingManager>& manager) {
  platform::SuspendHandlers handlers;
  handlers.willSleep = [weak = std::weak_ptr(manager)](const std::shared_ptr<void>& hold) {
    const auto told = weak.lock();
    if (!told) return;
    QV_LOG(logs::kDaemon, "the device is about to sleep");
    told->notifySystemRecordingMayBeStopped();
    told->sequence().async([hold] {});  // let go of when the manager has done that
  };
  handlers.didWake = [weak = std::weak_ptr(manager)](std::chrono::nanoseconds asleep) {
    const auto told = weak.lock();
    if (!told) return;
    QV_LOG(logs::kDaemon, "the device has slept for %lld s",
           static_cast<long long>(std::chrono::duration_cast<std::chrono::seconds>(asleep).count()));
    if (asleep > kLongestSleepOfRecording) {
      told->stopSystemRecordingWithInterruption();
    } else {
      told->notifySystemRecordingResumed();
    }
  };
  return handlers;
}

}  // namespace qv
