#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/Platform.h"
#include "platform/StatusBar.h"
#include "platform/base/Value.h"
#include "platform/threads/Timer.h"
#include "support/QVBundleTexts.h"

namespace qv {

/// The owner of an indicator, to be told about it.
///
/// Threading: called on the main queue.
class QVStatusBarAssertionDelegate {
 public:
  virtual ~QVStatusBarAssertionDelegate() = default;
};

/// The model of the indicator that tells the user that a recording or a broadcast is running: its state,
/// its timer, its texts. The operations that show something do nothing, since a television has no status
/// bar; a device that has one fills them in. Offered, not called by this daemon.
///
/// Threading: main queue only, except `startRepeatingTimer` and `stringWithTimeInterval`, which any thread may call.
class QVStatusBarAssertion : public std::enable_shared_from_this<QVStatusBarAssertion> {
 public:
  /// Both are borrowed, and must outlive this.
  QVStatusBarAssertion(const platform::Platform& platform, const QVBundleTexts& texts)
      : platform_(platform), texts_(texts) {}
  virtual ~QVStatusBarAssertion() = default;
  QVStatusBarAssertion(const QVStatusBarAssertion&) = delete;
  QVStatusBarAssertion& operator=(const QVStatusBarAssertion&) = delete;

  bool microphoneEnabled = false;
  bool broadcasting = false;
  bool paused = false;
  std::string broadcastServiceName;
  std::shared_ptr<platform::StatusBarOverrideCoordinatorDelegate> delegate;
  std::shared_ptr<QVStatusBarAssertionDelegate> assertionDelegate;
  std::shared_ptr<platform::StatusBarOverrideAssertion> assertion;
  std::shared_ptr<platform::StatusBarOverrideCoordinator> coordinator;

  virtual void showDoubleHeightStatusBarWithPid(int32_t processID);
  virtual void invalidateDoubleHeightStatusBar();
  /// `duration` in seconds.
  virtual void updateDoubleHeightStatusBarWithDuration(double duration, bool isPaused);
  /// What the timer does, twice a second.
  virtual void updateStatusStringWithTimer(platform::TimerHandle& timer);

  /// Starts the timer, in place of a running one, a moment later on the main queue. It runs until the next
  /// start or the end of this object.
  void startRepeatingTimer();
  /// When the timer was last started.
  [[nodiscard]] const std::optional<platform::Date>& timerStartDate() const { return timerStartDate_; }

  /// Elapsed seconds as minutes and seconds ("0:05", "59:59"), from an hour on as hours and minutes ("1:00",
  /// "25:00"). Parts of the last unit are left off; what is no time is "0:00".
  [[nodiscard]] static std::string stringWithTimeInterval(double seconds);
  /// What the indicator says, in the user's language. The duration does not appear in it.
  [[nodiscard]] std::string qvLocalizedRecordingDuration(double duration, bool isPaused) const;

 private:
  const platform::Platform& platform_;
  const QVBundleTexts& texts_;
  std::shared_ptr<platform::TimerHandle> timer_;
  std::optional<platform::Date> timerStartDate_;
};

}  // namespace qv
