#include "platform/linux/FreeSpaceWatch.h"

#include <algorithm>
#include <utility>

#include "platform/Log.h"

namespace qv::platform {

namespace {

constexpr uint64_t kFastestLoss = 50'000;  // bytes in a millisecond
constexpr std::chrono::milliseconds kSoonest{1000};
constexpr std::chrono::milliseconds kLatest{60'000};

/// The range of each urgency begins below these.
constexpr uint64_t kThresholds[] = {UINT64_MAX, freespace::kLow, freespace::kVeryLow, freespace::kCritical};
constexpr int32_t kHighestUrgency = 3;

}  // namespace

int32_t urgencyOfFreeSpace(uint64_t freeBytes) {
  int32_t urgency = 0;
  while (urgency < kHighestUrgency && freeBytes < kThresholds[urgency + 1]) ++urgency;
  return urgency;
}

std::chrono::milliseconds nextLookAtFreeSpace(uint64_t freeBytes) {
  const int32_t next = std::min(urgencyOfFreeSpace(freeBytes) + 1, kHighestUrgency);
  const uint64_t left = freeBytes > kThresholds[next] ? freeBytes - kThresholds[next] : 0;
  const uint64_t time = std::min(left / kFastestLoss, static_cast<uint64_t>(kLatest.count()));
  return std::max(kSoonest, std::chrono::milliseconds(time));
}

FreeSpaceWatch::FreeSpaceWatch(TimerService& timers, Executor& executor, FreeSpace freeSpace)
    : state_(std::make_shared<State>(timers, executor, std::move(freeSpace))) {}

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
  const bool mustBeConfirmed = isCritical && urgency < kHighestUrgency;
  lookSoon(mustBeConfirmed ? freespace::kCriticalFor : freeBytes ? nextLookAtFreeSpace(*freeBytes) : kLatest);
}

/// With the mutex held.
int32_t FreeSpaceWatch::State::urgencyNow(uint64_t freeBytes) {
  const int32_t now = urgencyOfFreeSpace(freeBytes);
  const bool wasCritical = std::exchange(isCritical, now == kHighestUrgency);
  return isCritical && isActive && !wasCritical ? kHighestUrgency - 1 : now;
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
  const auto amount = static_cast<int64_t>(kThresholds[now] - freeBytes);
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
