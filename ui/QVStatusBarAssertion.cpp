#include "ui/QVStatusBarAssertion.h"

#include <chrono>
#include <cstdio>

#include "platform/threads/Log.h"
#include "ui/FormattedText.h"

namespace qv {

namespace logs = platform::logs;

namespace {
constexpr std::chrono::milliseconds kTick{500};
constexpr double kLongest = 1e12;  // seconds; more is no time that anybody sees
}  // namespace

void QVStatusBarAssertion::showDoubleHeightStatusBarWithPid(int32_t processID) {
  QV_LOG(logs::kUI, "%s for process %d", coordinator ? "the indicator is shown" : "no indicator is to be shown",
         processID);
  shown_ = {qvLocalizedRecordingDuration(0, paused), stringWithTimeInterval(0), paused};
  if (coordinator) assertion = coordinator->acquire(shown_, weak_from_this());
  tellTime();
  startRepeatingTimer();
}

void QVStatusBarAssertion::invalidateDoubleHeightStatusBar() {
  timer_.reset();
  assertion.reset();
}

void QVStatusBarAssertion::updateDoubleHeightStatusBarWithDuration(double duration, bool isPaused) {
  const auto former = shown_;
  if (paused != isPaused) shown_.text = qvLocalizedRecordingDuration(duration, isPaused);  // read from files
  shown_.isPaused = paused = isPaused;
  shown_.time = stringWithTimeInterval(duration);
  if (assertion && shown_ != former) assertion->update(shown_);
  if (shown_.time != former.time) tellTime();
}

void QVStatusBarAssertion::updateStatusStringWithTimer(platform::TimerHandle&) {
  const auto owner = assertionDelegate.lock();
  if (!owner) return;
  const auto progress = owner->statusBarAssertionProgress();
  updateDoubleHeightStatusBarWithDuration(progress.seconds, progress.isPaused);
}

void QVStatusBarAssertion::tellTime() {
  if (const auto owner = assertionDelegate.lock()) owner->statusBarAssertionDidUpdateTime(shown_.time);
}

void QVStatusBarAssertion::statusBarOverrideWasPressed() {
  platform_.mainQueue->async(weak_from_this(), [](QVStatusBarAssertion& self) {
    if (const auto owner = self.assertionDelegate.lock()) owner->statusBarAssertionWasPressed();
  });
}

void QVStatusBarAssertion::startRepeatingTimer() {
  platform_.mainQueue->async(weak_from_this(), [](QVStatusBarAssertion& self) {
    self.timerStartDate_ = self.platform_.clock->now();
    self.timer_.reset();
    // A tick that was queued before a new start finds that its timer has gone.
    auto timer = std::make_shared<std::weak_ptr<platform::TimerHandle>>();
    self.timer_ =
        self.platform_.timers->every(kTick, [&queue = *self.platform_.mainQueue, weak = self.weak_from_this(), timer] {
          queue.async(weak, [timer](QVStatusBarAssertion& ticked) {
            const auto current = timer->lock();
            if (current && current == ticked.timer_) ticked.updateStatusStringWithTimer(*current);
          });
        });
    *timer = self.timer_;
  });
}

std::string QVStatusBarAssertion::stringWithTimeInterval(double seconds) {
  const auto whole = seconds > 0 && seconds < kLongest ? static_cast<long long>(seconds) : 0;
  const bool hasHours = whole >= 3600;
  const long long large = hasHours ? whole / 3600 : whole / 60;
  const long long small = hasHours ? whole / 60 % 60 : whole % 60;
  char text[32];
  std::snprintf(text, sizeof text, "%lld:%02lld", large, small);
  return text;
}

std::string QVStatusBarAssertion::qvLocalizedRecordingDuration(double, bool isPaused) const {
  if (!broadcasting) return texts_.localizedText(isPaused ? "RECORDING_PAUSED_STATUS_BAR" : "RECORDING_STATUS_BAR");
  return formatted(
      texts_.localizedText(isPaused ? "BROADCASTING_PAUSED_STATUS_BAR_FORMAT" : "BROADCASTING_STATUS_BAR_FORMAT"),
      broadcastServiceName);
}

}  // namespace qv
