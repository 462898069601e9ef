#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/PurgeableSpace.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Timer.h"

namespace qv::platform {

/// Which free space makes a request for space how urgent.
struct FreeSpaceLimits {
  /// Of the urgencies 1, 2 and 3: bytes, each fewer than the one before. Space below a threshold has its urgency.
  std::array<uint64_t, 3> thresholds{};
  /// For so long the space must be below the last threshold before the highest urgency is asked for while the watch is
  /// active; till then it is the urgency before.
  std::chrono::seconds criticalFor{0};

  /// 0 where there is space enough.
  [[nodiscard]] int32_t urgencyOf(uint64_t freeBytes) const;
  [[nodiscard]] int32_t highestUrgency() const { return static_cast<int32_t>(thresholds.size()); }
  /// Below it the space has this urgency (1 or more).
  [[nodiscard]] uint64_t thresholdOf(int32_t urgency) const { return thresholds.at(static_cast<size_t>(urgency - 1)); }
  /// When to look again: sooner the nearer the next threshold is, so that a disk which loses 50 MB a second is seen in
  /// time; 1 s at least, 60 s at most.
  [[nodiscard]] std::chrono::milliseconds nextLook(uint64_t freeBytes) const;
};

/// Asks the registered services for space before the disk is full, and once a day for what has become
/// old.
///
/// While it is active (files are being written) the free space is looked at from time to time; when it
/// falls into a more urgent range, each service's purge callback is called with the bytes that lack to
/// leave the range, and the urgency. The periodic callback, with amount 0 and urgency 0, is called once a day,
/// and the free space looked at. While it is not active that is the only wake-up.
///
/// Threading: thread-safe; callbacks run on the executor. Destroying it ends the calls, apart from one
/// that is on its way.
class FreeSpaceWatch final : public PurgeableSpaceService {
 public:
  /// Bytes free where the services' files are; nothing where that cannot be read. Called on the executor.
  using FreeSpace = std::function<std::optional<uint64_t>()>;
  FreeSpaceWatch(TimerService& timers, Executor& executor, FreeSpaceLimits limits, FreeSpace freeSpace);
  /// Replaces an earlier registration of the same name.
  void registerCallbacks(const std::string& serviceName, PurgeableSpaceCallbacks callbacks) override;
  void setActive(bool isActive);

 private:
  struct State : std::enable_shared_from_this<State> {
    State(TimerService& timersToUse, Executor& executorToUse, FreeSpaceLimits limitsToUse, FreeSpace function)
        : timers(timersToUse),
          executor(executorToUse),
          limits(std::move(limitsToUse)),
          freeSpace(std::move(function)) {}
    void lookSoon(std::chrono::milliseconds delay);
    void look();
    void requestSpace(uint64_t freeBytes);
    int32_t urgencyNow(uint64_t freeBytes);
    void runPeriodic(const std::string& serviceName);

    TimerService& timers;
    Executor& executor;
    const FreeSpaceLimits limits;
    const FreeSpace freeSpace;
    std::mutex mutex;
    // Guarded by mutex:
    std::map<std::string, std::shared_ptr<const PurgeableSpaceCallbacks>> services;
    std::map<std::string, std::unique_ptr<TimerHandle>> daily;
    std::unique_ptr<TimerHandle> nextLook;
    bool isActive = false;
    int32_t urgency = 0;      ///< of the range in which the free space was last seen
    bool isCritical = false;  ///< it was in the most urgent one, which counts from the next look on
  };
  const std::shared_ptr<State> state_;
};

}  // namespace qv::platform
