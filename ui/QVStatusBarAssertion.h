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

/// The owner of an indicator: knows what is to be told, and is told what happens to it.
///
/// Threading: called on the main queue.
class QVStatusBarAssertionDelegate {
 public:
  virtual ~QVStatusBarAssertionDelegate() = default;
  struct Progress {
    double seconds = 0;  ///< recorded so far, without pauses
    bool isPaused = false;
  };
  [[nodiscard]] virtual Progress statusBarAssertionProgress() = 0;
  /// The elapsed time reads so from now on.
  virtual void statusBarAssertionDidUpdateTime(const std::string& time) = 0;
  virtual void statusBarAssertionWasPressed() = 0;
};

/// The indicator that tells the user that a recording or a broadcast is running: its state, its timer, its texts.
///
/// It is shown from `showDoubleHeightStatusBarWithPid` until it is invalidated, or destroyed. Twice a second it asks
/// its delegate how far the recording has come, and shows what differs. Without a coordinator it shows nothing, and
/// tells the delegate the time all the same.
///
/// Threading: main queue only, except `startRepeatingTimer` and `stringWithTimeInterval`, which any thread may call,
/// and the destructor.
class QVStatusBarAssertion : public platform::StatusBarOverrideCoordinatorDelegate,
                             public std::enable_shared_from_this<QVStatusBarAssertion> {
 public:
  /// Both are borrowed, and must outlive this.
  QVStatusBarAssertion(const platform::Platform& platform, const QVBundleTexts& texts)
      : platform_(platform), texts_(texts) {}
  ~QVStatusBarAssertion() override = default;
  QVStatusBarAssertion(const QVStatusBarAssertion&) = delete;
  QVStatusBarAssertion& operator=(const QVStatusBarAssertion&) = delete;

  // Set before it is shown:
  bool microphoneEnabled = false;
  bool broadcasting = false;
  bool paused = false;
  std::string broadcastServiceName;
  std::weak_ptr<QVStatusBarAssertionDelegate> assertionDelegate;
  platform::StatusBarOverrideCoordinator* coordinator = nullptr;  ///< borrowed; may be null
  /// While it is shown, and there is a coordinator.
  std::unique_ptr<platform::StatusBarOverrideAssertion> assertion;

  /// `processID`: whose recording it is, for the log.
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

  void statusBarOverrideWasPressed() override;

 private:
  void tellTime();

  const platform::Platform& platform_;
  const QVBundleTexts& texts_;
  std::shared_ptr<platform::TimerHandle> timer_;
  std::optional<platform::Date> timerStartDate_;
  platform::StatusBarOverride shown_;
};

}  // namespace qv
