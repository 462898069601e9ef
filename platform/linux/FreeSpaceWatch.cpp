#include "platform/linux/FreeSpaceWatch.h"

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"

namespace qv::platform {

namespace {

constexpr uint64_t kFastestLoss = 50'000;  // bytes in a millisecond
constexpr std::chrono::milliseconds kSoonest{1000};
constexpr std::chrono::milliseconds kLatest{60'000};

}  // namespace

int32_t FreeSpaceLimits::urgencyOf(uint64_t freeBytes) const {
  int32_t urgency = 0;
  while (urgency < highestUrgency() && freeBytes < thresholdOf(urgency + 1)) ++urgency;
  return urgency;
}

std::chrono::milliseconds FreeSpaceLimits::nextLook(uint64_t freeBytes) const {
  const uint64_t threshold = thresholdOf(std::min(urgencyOf(freeBytes) + 1, highestUrgency()));
  const uint64_t left = freeBytes > threshold ? freeBytes - threshold : 0;
  const uint64_t time = std::min(left / kFastestLoss, static_cast<uint64_t>(kLatest.count()));
  return std::max(kSoonest, std::chrono::milliseconds(time));
}

FreeSpaceWatch::FreeSpaceWatch(TimerService& timers, Executor& executor, FreeSpaceLimits limits, FreeSpace freeSpace)
    : state_(std::make_shared<State>(timers, executor, std::move(limits), std::move(freeSpace))) {}

void FreeSpaceWatch::registerCallbacks(const std::string& serviceName, PurgeableSpaceCallbacks callbacks) {
  auto timer = state_->timers.every(std::chrono::hours(24), [weak = state_->weak_from_this(), serviceName] {
    const auto state = weak.lock();
    if (!state) return;
    state->executor.post([weak, serviceName] {
      if (const auto self = weak.lock()) self->runPeriodic(serviceName);
    });
  });
  std::lock_guard lock(state_->mutex);
  state_->services[serviceName] = std::make_shared<const PurgeableSpaceCallbacks>(std::move(callbacks));
  state_->daily[serviceName] = std::move(timer);
}

void FreeSpaceWatch::setActive(bool isActive) {
  std::lock_guard lock(state_->mutex);
  state_->isActive = isActive;
  state_->nextLook.reset();
  if (!isActive) return;
  state_->urgency = 0;
  state_->isCritical = false;
  state_->lookSoon(kSoonest);
}

/// With the mutex held.
void FreeSpaceWatch::State::lookSoon(std::chrono::milliseconds delay) {
  nextLook = timers.after(delay, [weak = weak_from_this()] {
    const auto state = weak.lock();
    if (!state) return;
    state->executor.post([weak] {
      if (const auto self = weak.lock()) self->look();
    });
  });
}

void FreeSpaceWatch::State::look() {
  const auto freeBytes = freeSpace();
  if (freeBytes) requestSpace(*freeBytes);
  std::lock_guard lock(mutex);
  if (!isActive) return;
  const bool mustBeConfirmed = isCritical && urgency < limits.highestUrgency();
  lookSoon(mustBeConfirmed ? limits.criticalFor : freeBytes ? limits.nextLook(*freeBytes) : kLatest);
}

/// With the mutex held.
int32_t FreeSpaceWatch::State::urgencyNow(uint64_t freeBytes) {
  const int32_t now = limits.urgencyOf(freeBytes);
  const bool wasCritical = std::exchange(isCritical, now == limits.highestUrgency());
  return isCritical && isActive && !wasCritical ? now - 1 : now;
}

void FreeSpaceWatch::State::requestSpace(uint64_t freeBytes) {
  decltype(services) asked;
  int32_t now = 0;
  {
    std::lock_guard lock(mutex);
    now = urgencyNow(freeBytes);
    const int32_t before = std::exchange(urgency, now);
    if (now <= before) return;
    asked = services;
  }
  const auto amount = static_cast<int64_t>(limits.thresholdOf(now) - freeBytes);
  for (const auto& [name, callbacks] : asked) {
    if (!callbacks->purge) continue;
    QV_LOG(logs::kPlatform, "%llu bytes are free: %s is asked for space, urgency %d",
           static_cast<unsigned long long>(freeBytes), name.c_str(), static_cast<int>(now));
    const int64_t freed = callbacks->purge(amount, now);
    QV_LOG_INFO(logs::kPlatform, "%s freed %lld bytes", name.c_str(), static_cast<long long>(freed));
  }
}

void FreeSpaceWatch::State::runPeriodic(const std::string& serviceName) {
  std::shared_ptr<const PurgeableSpaceCallbacks> callbacks;
  {
    std::lock_guard lock(mutex);
    callbacks = services[serviceName];
    if (!isActive) urgency = 0;
  }
  if (callbacks && callbacks->periodic) {
    const int64_t freed = callbacks->periodic(0, 0);
    QV_LOG_INFO(logs::kPlatform, "%s freed %lld bytes", serviceName.c_str(), static_cast<long long>(freed));
  }
  if (const auto freeBytes = freeSpace()) requestSpace(*freeBytes);
}

}  // namespace qv::platform
