#pragma once

#include <mutex>
#include <string>

#include "platform/ScreenCapture.h"
#include "platform/threads/Clock.h"

namespace qv::platform {

/// What captures are to show; read when one starts.
///
/// Threading: thread-safe.
class X11DisplayClone final : public DisplayCloneService {
 public:
  struct State {
    DisplayCloneMode mode = DisplayCloneMode::Off;
    std::set<uint32_t> contexts;
  };
  void setMirroringMode(DisplayCloneMode mode) override;
  void setCloneContexts(std::set<uint32_t> contextIDs) override;
  [[nodiscard]] State state() const;

 private:
  mutable std::mutex mutex_;
  State state_;
};

/// Screen capture on an X server. A layer context is a window id.
///
/// Windows are captured by their own contents, whatever covers them; the pointer is drawn where it
/// is over them. Nothing runs, and no server connection is held, while nothing is captured.
///
/// Threading: thread-safe. Delegates are called on one thread per capture.
class X11ScreenCaptureService final : public ScreenCaptureService {
 public:
  /// `display` as in $DISPLAY; `clock` outlives the controllers.
  X11ScreenCaptureService(std::string display, Clock& clock);
  std::unique_ptr<ScreenCaptureController> createController(Size size, MediaTime minimumInterval) override;
  DisplayCloneService& displayClone() override { return *clone_; }

 private:
  const std::string display_;
  Clock& clock_;
  std::shared_ptr<X11DisplayClone> clone_ = std::make_shared<X11DisplayClone>();
};

}  // namespace qv::platform
