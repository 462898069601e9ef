#pragma once

#include <cstdint>
#include <memory>
#include <set>

#include "platform/ScreenCapture.h"

namespace qv {

/// What a recording wants to see.
struct ScreenRequest {
  platform::DisplayCloneMode mode = platform::DisplayCloneMode::Off;
  std::set<uint32_t> contextIDs = {};  ///< the windows, in mode CloneContexts
  platform::Size size;
  int32_t frameRate = 60;  ///< at most so many pictures a second
};

/// One recording's hold on the screen, for one stretch from a start or resume to the next stop.
///
/// Threading: thread-safe. `startCapture` waits for no callback of the delegate, so it may be called with a lock that
/// these take. The destructor returns when none is running: it must not run in one, nor with such a lock held.
class ScreenLease {
 public:
  virtual ~ScreenLease() = default;
  /// Begins to capture, once: what comes later is ignored.
  virtual void startCapture() = 0;
};

/// The screen, which recordings share one after another. Handing out a lease points the display clone service at what
/// it asks for, and so does the start of a capture, if another lease has pointed it elsewhere since; the end of a lease
/// turns cloning off if it was the last to point.
///
/// The last controller whose lease has ended is kept, and taken if the next lease has the same size and rate. Leases
/// may outlive this object, though not the service.
///
/// Threading: thread-safe.
class QVScreenSource {
 public:
  explicit QVScreenSource(platform::ScreenCaptureService& service);
  ~QVScreenSource();
  QVScreenSource(const QVScreenSource&) = delete;
  QVScreenSource& operator=(const QVScreenSource&) = delete;

  /// The delegate gets frames and failures from `startCapture` to the end of the lease. Never null.
  [[nodiscard]] std::unique_ptr<ScreenLease> lease(
      const ScreenRequest& request, const std::weak_ptr<platform::ScreenCaptureControllerDelegate>& delegate);

 private:
  class Lease;
  struct State;
  const std::shared_ptr<State> state_;
};

}  // namespace qv
