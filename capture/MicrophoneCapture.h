#pragma once

#include <atomic>
#include <memory>
#include <optional>

#include "capture/MicrophoneLease.h"
#include "platform/Platform.h"
#include "platform/threads/Clock.h"
#include "platform/threads/Guarded.h"

namespace qv {

class QVCaptureManager;

/// Whether an interruption of the audio session began and no microphone sample was handled since.
using MicInterrupted = std::atomic<bool>;

/// The lease as the capture manager makes it: a device capture session of its own, with one input and one output.
///
/// Threading: as MicrophoneLease.
class MicrophoneCapture final : public MicrophoneLease, private platform::CaptureOutputDelegate {
 public:
  MicrophoneCapture(platform::Platform& platform, QVCaptureManager& manager,
                    std::shared_ptr<MicInterrupted> micInterrupted, OutputHandler outputHandler,
                    DidStartHandler didStartHandler);
  ~MicrophoneCapture() override;

 private:
  using PendingHandler = platform::Guarded<DidStartHandler>;

  void startCaptureSession();
  void attachMicrophone();
  void attachInputAndOutput(platform::DeviceCaptureSession& session);
  static void runMicDidStartHandler(PendingHandler& pending);
  void stopCaptureSession();
  void stopMicrophoneCapture();

  void captureOutputDidOutputSampleBuffer(const platform::CaptureOutput& output,
                                          const platform::SampleBufferRef& sample) override;
  void checkAndHandleMicInterruption();

  platform::Platform& platform_;
  QVCaptureManager& manager_;
  const std::shared_ptr<MicInterrupted> micInterrupted_;
  const OutputHandler microphoneOutputHandler_;
  /// The session's observer holds it weakly: it may be called when the lease is gone.
  const std::shared_ptr<PendingHandler> micDidStartHandler_;
  std::atomic<bool> isEnding_{false};
  platform::Guarded<std::shared_ptr<platform::DeviceCaptureSession>> captureSession_;

  // Audio dispatch queue only.
  std::shared_ptr<platform::CaptureDeviceInput> captureDeviceAudioInput_;
  std::shared_ptr<platform::AudioDataOutput> captureSessionAudioDataOutput_;

  // Capture sample queue only.
  /// When the last sample handed on will have finished playing, by the wall clock.
  std::optional<platform::Date> lastMicAudioDate_;
  /// The presentation time at which the last sample ends.
  platform::MediaTime micInterruptionPresentationTimeStamp_;
};

}  // namespace qv
