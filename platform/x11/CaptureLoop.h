#pragma once

#include <chrono>
#include <functional>
#include <set>

#include "platform/ScreenCapture.h"
#include "platform/threads/Clock.h"
#include "platform/x11/CaptureSource.h"
#include "platform/x11/PointerOverlay.h"

namespace qv::platform {

/// What one capture is to do.
struct CaptureParameters {
  std::string display;
  FrameLayout layout;
  std::chrono::nanoseconds interval{0};
  DisplayCloneMode mode = DisplayCloneMode::Off;
  std::set<uint32_t> contexts;
};

/// Where a capture's events go. `sample` answers whether to go on.
struct CaptureEvents {
  std::function<bool(const SampleBufferRef&)> sample;
  std::function<void(int32_t status)> failed;
  std::function<void()> serverLost;
};

/// One capture from its start to its stop, on a connection of its own.
///
/// It sleeps until the server tells of a change, the picture is due again, or `stopFd` becomes
/// readable. A changed picture is taken at once if the last one is an interval ago, otherwise on
/// the next of the deadlines that stand an interval apart; while it waits for one, further
/// changes do not wake it.
///
/// Threading: `run` on the capture thread, once.
class CaptureLoop {
 public:
  CaptureLoop(CaptureParameters parameters, CaptureEvents events, Clock& clock, int stopFd);
  /// Returns when stopped, failed, or told so by an event's answer.
  void run();

 private:
  using Nanoseconds = std::chrono::nanoseconds;
  std::optional<int32_t> openSource();
  void loop();
  void handleEvents();
  [[nodiscard]] bool mayHaveChanged() const { return source_->hasChanged() || pointer_->hasMoved(); }
  bool takePictureIfChanged();
  bool takePicture();
  /// Hands out the last frame as the picture of `time`.
  bool deliver(MediaTime time);
  void advanceTick(Nanoseconds now);
  /// False when stopped.
  bool sleepUntil(Nanoseconds deadline, bool wakeForEvents);

  CaptureParameters parameters_;
  CaptureEvents events_;
  Clock& clock_;
  const int stopFd_;
  std::unique_ptr<XcbConnection> connection_;
  std::unique_ptr<CaptureSource> source_;
  std::unique_ptr<PointerOverlay> pointer_;
  std::unique_ptr<FrameComposer> composer_;
  SharedFramePool pool_;
  SharedFrameRef lastFrame_;
  MediaTime lastTime_ = MediaTime::zero();
  Nanoseconds nextTick_{0};
  Nanoseconds nextHeartbeat_{0};
};

}  // namespace qv::platform
