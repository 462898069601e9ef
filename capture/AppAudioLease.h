#pragma once

#include <functional>
#include <memory>

#include "platform/base/MediaTime.h"
#include "platform/base/SampleBuffer.h"

namespace qv {

class QVCaptureManager;

/// One recording's hold on the sound of applications, for one stretch from a start or resume to the next stop. It owns
/// the tap that it has started, and its end stops that tap and no other.
///
/// Sound before `captureStartTime` (the first screen frame of the stretch) is left out; until that is set, the tap's
/// buffers go back to it unread, so that it goes on at its own pace. The output handler must accept an absent sample: a
/// filler that could not be made.
///
/// Threading: thread-safe. Starts work asynchronously on the audio dispatch queue, where the handlers are called too;
/// stops (and the destructor) wait for it and must not be called from it, nor with a lock held that a handler takes.
class AppAudioLease {
 public:
  using OutputHandler = std::function<void(const platform::SampleBufferRef&)>;
  using DidStartHandler = std::function<void()>;

  virtual ~AppAudioLease() = default;
  /// Taps this process, in place of any that the lease taps. `didStartHandler` (may be empty) runs once: when the tap
  /// runs, or when it turns out that it cannot be made or started, for sound that cannot be had must not cost the
  /// picture. Not at all where the tap was stopped or replaced before.
  virtual void startAppAudioCaptureForProcessID(int32_t processID, DidStartHandler didStartHandler) = 0;
  /// Like a start; the gap since the last sound of this lease is filled before the first buffer.
  virtual void resumeAppAudioCaptureForProcessID(int32_t processID, DidStartHandler didStartHandler) = 0;
  /// What was played up to the call has reached the output handler when this returns.
  virtual void stopAppAudioCapture() = 0;
  /// The same without waiting: a later stop, or the end, waits for it. So several sources can stop at once.
  virtual void beginStoppingAppAudioCapture() = 0;
  [[nodiscard]] virtual platform::MediaTime captureStartTime() const = 0;
  virtual void setCaptureStartTime(platform::MediaTime time) = 0;
};

}  // namespace qv
