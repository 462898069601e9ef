#pragma once

#include <memory>
#include <vector>

#include "capture/AppAudioLease.h"
#include "capture/MicrophoneCapture.h"
#include "platform/Platform.h"
#include "platform/base/SampleBuffer.h"
#include "platform/threads/Guarded.h"

namespace qv {

/// Gives out every capture source other than the screen: the microphone, a camera route, and taps on one process's
/// sound. There is one for the process, shared by all sessions, which record at the same time as they please: what one
/// starts belongs to its lease and ends with it, and nothing here ends anybody else's.
///
/// A microphone interruption and a change of the tapped process leave a gap in the sound, which one silent filler
/// sample covers. Samples reach the output handlers as they come; a handler that keeps one takes its own reference.
///
/// Lifetime: no lease may outlive the manager.
///
/// Threading: thread-safe. Microphone and camera handlers are called on the capture sample queue, the handlers of
/// application sound on the audio dispatch queue; the leases tell who waits for these.
class QVCaptureManager final : public platform::CaptureOutputDelegate {
 public:
  using OutputHandler = std::function<void(const platform::SampleBufferRef&)>;
  using DidStartHandler = std::function<void()>;

  explicit QVCaptureManager(platform::Platform& platform);
  ~QVCaptureManager() override;

  /// Whether the device has a microphone, by its description.
  [[nodiscard]] bool hasAudioCaptureDevice() const;
  /// Whether somebody has given a camera's output. Nothing in this daemon does.
  [[nodiscard]] bool hasVideoCaptureDevice() const;
  [[nodiscard]] platform::SerialQueue& audioDispatchQueue() { return audioDispatchQueue_; }
  [[nodiscard]] platform::SerialQueue& sessionSampleBufferQueue() { return sessionSampleBufferQueue_; }

  /// Taps nothing yet. Never null.
  [[nodiscard]] std::unique_ptr<AppAudioLease> leaseAppAudio(OutputHandler outputHandler);
  /// Starts asynchronously on the audio dispatch queue. `didStartHandler` (may be empty) runs once, when the microphone
  /// runs. Never null: where there is no microphone, nothing comes.
  [[nodiscard]] std::unique_ptr<MicrophoneLease> startMicrophoneCaptureWithOutput(OutputHandler outputHandler,
                                                                                  DidStartHandler didStartHandler);

  /// The camera route, offered to a device that has a camera, not called by this daemon. Replaces a former output,
  /// and takes it away with none.
  void setCaptureSessionVideoDataOutput(std::shared_ptr<platform::VideoDataOutput> output);
  void setCameraOutputHandler(OutputHandler handler) { cameraOutputHandler_.store(std::move(handler)); }
  void captureOutputDidOutputSampleBuffer(const platform::CaptureOutput& output,
                                          const platform::SampleBufferRef& sample) override;

  /// `type` 1: an interruption of the audio session began; 0: it ended.
  void handleAudioSessionInterruption(uint32_t type);

  /// Silence of `gap` seconds in the format of `audioBasicDescription`, as one timing entry. Nothing
  /// for a gap beyond ten minutes: only a jump of the wall clock looks like that.
  [[nodiscard]] platform::SampleBufferRef createEmptyAudioSampleBuffer(platform::MediaTime presentationTime,
                                                                       double gap) const;
  [[nodiscard]] platform::AudioFormatDescriptionRef createAudioFormatDescription() const;
  [[nodiscard]] const platform::AudioStreamDescription& audioBasicDescription() const { return audioBasicDescription_; }

 private:
  platform::Platform& platform_;
  const platform::AudioStreamDescription audioBasicDescription_;
  platform::SerialQueue audioDispatchQueue_;
  platform::SerialQueue sessionSampleBufferQueue_;
  /// One for each microphone lease that lives, and some that have ended.
  platform::Guarded<std::vector<std::weak_ptr<MicInterrupted>>> microphones_;
  platform::Guarded<OutputHandler> cameraOutputHandler_;
  platform::Guarded<std::shared_ptr<platform::VideoDataOutput>> captureSessionVideoDataOutput_;
};

}  // namespace qv
