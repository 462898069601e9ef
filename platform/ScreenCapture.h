#pragma once

#include <cstdint>
#include <memory>
#include <set>

#include "platform/base/Geometry.h"
#include "platform/base/SampleBuffer.h"

namespace qv::platform {

class ScreenCaptureController;

/// Receives what a controller captures, all on the service's capture thread.
class ScreenCaptureControllerDelegate {
 public:
  virtual ~ScreenCaptureControllerDelegate() = default;
  /// One frame. `transformFlags`: bit 2 quarter turn clockwise, bit 1 mirrored in x, bit 0
  /// mirrored in y. The presentation time is the host time at which the picture was taken.
  virtual void screenCaptureControllerDidReceiveSampleBuffer(ScreenCaptureController& controller,
                                                             const SampleBufferRef& sample,
                                                             uint64_t transformFlags) = 0;
  /// Capture has failed for good; no further frames come.
  virtual void screenCaptureControllerDidFailWithStatus(ScreenCaptureController& controller, int32_t status) = 0;
  /// Another user of the screen took precedence; no further frames come.
  virtual void screenCaptureControllerWasPreempted(ScreenCaptureController& controller) = 0;
  /// The display server has gone or was restarted; no further frames come.
  virtual void screenCaptureControllerMediaServicesWereReset(ScreenCaptureController& controller) = 0;
};

/// Captures what the clone service shows, at a fixed size.
///
/// Frames have exactly the size the controller was made with: another source size is scaled and
/// letterboxed. Changed pictures are delivered at up to the asked rate, and an unchanged one again
/// at least twice a second, so that its time goes on. When nothing of the source is left the
/// picture is black. Frames come from a bounded pool; when all of them are held, a tick is skipped.
///
/// Threading: thread-safe. `stopCapture` and `setDelegate(nullptr)` return when no callback is
/// running, except when called from within one.
class ScreenCaptureController {
 public:
  virtual ~ScreenCaptureController() = default;
  virtual void setDelegate(std::weak_ptr<ScreenCaptureControllerDelegate> delegate) = 0;
  /// Takes up the clone service's state of this moment. Delivers the first frame without waiting
  /// for a change. Can be started again after a stop.
  virtual void startCapture() = 0;
  virtual void stopCapture() = 0;
};

enum class DisplayCloneMode : int32_t {
  Off = 0,
  MirrorScreen = 1,
  CloneContexts = 3,
};

/// Selects what the screen capture sees.
///
/// Threading: thread-safe.
class DisplayCloneService {
 public:
  virtual ~DisplayCloneService() = default;
  virtual void setMirroringMode(DisplayCloneMode mode) = 0;
  /// The layer contexts (windows) shown in mode CloneContexts, composed in stacking order.
  virtual void setCloneContexts(std::set<uint32_t> contextIDs) = 0;
};

class ScreenCaptureService {
 public:
  virtual ~ScreenCaptureService() = default;
  /// `size` is rounded down to whole pixels (1 at least, 16384 at most); NaN counts as 1.
  virtual std::unique_ptr<ScreenCaptureController> createController(Size size, MediaTime minimumInterval) = 0;
  virtual DisplayCloneService& displayClone() = 0;
};

}  // namespace qv::platform
