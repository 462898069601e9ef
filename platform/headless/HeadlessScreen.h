#pragma once

#include <atomic>

#include "platform/ScreenCapture.h"
#include "platform/threads/PacedClock.h"

namespace qv::platform {

/// A screen that shows the test picture of TestSignal.h: whole in mirror mode, and as the window of
/// every context in context mode. Black while nothing is cloned.
///
/// Frames are due at the multiples of the minimum interval on the host clock, and that is their
/// presentation time; the first of a start is of the moment of the start.
///
/// Threading: thread-safe. One thread per controller that captures.
class HeadlessScreen final : public ScreenCaptureService, public DisplayCloneService {
 public:
  /// `clock` is the host clock.
  explicit HeadlessScreen(PacedClock& clock) : clock_(clock) {}
  std::unique_ptr<ScreenCaptureController> createController(Size size, MediaTime minimumInterval) override;
  DisplayCloneService& displayClone() override { return *this; }
  void setMirroringMode(DisplayCloneMode mode) override { shared_->mode = mode; }
  void setCloneContexts(std::set<uint32_t> contextIDs) override { shared_->hasContexts = !contextIDs.empty(); }

  /// What controllers know of the clone service; they may outlive the screen.
  struct CloneState {
    [[nodiscard]] bool showsPicture() const {
      return mode == DisplayCloneMode::MirrorScreen || (mode == DisplayCloneMode::CloneContexts && hasContexts);
    }
    std::atomic<DisplayCloneMode> mode = DisplayCloneMode::Off;
    std::atomic<bool> hasContexts = false;
  };

 private:
  PacedClock& clock_;
  const std::shared_ptr<CloneState> shared_ = std::make_shared<CloneState>();
};

}  // namespace qv::platform
