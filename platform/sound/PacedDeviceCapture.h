#pragma once

#include <mutex>

#include "platform/DeviceCapture.h"
#include "platform/sound/PCMSource.h"

namespace qv::platform {

/// Where the microphone's sound comes from.
struct MicrophoneSource {
  /// Whether there is a microphone now.
  std::function<bool()> isAvailable;
  /// Opens it; nothing where that fails. Its format is 16-bit big-endian mono at 44.1 kHz.
  std::function<std::unique_ptr<PCMSource>(const PCMFormat& format)> open;
};

/// Capture sessions with one microphone input and one audio output, over any source of sound.
///
/// The microphone is open, and a thread runs, only while a running session has both. Samples are
/// of 1024 frames, the last one before a stop of fewer. Removing an output waits for a callback in progress, unless
/// called on the callback's queue.
///
/// Threading: thread-safe. `open` is called in the thread that completes a session.
class PacedDeviceCapture final : public DeviceCaptureService {
 public:
  /// `clock` is the host clock.
  explicit PacedDeviceCapture(MicrophoneSource microphone, PacedClock& clock = monotonicClock());
  ~PacedDeviceCapture() override;

  std::shared_ptr<DeviceCaptureSession> createSession() override;
  std::shared_ptr<CaptureDeviceInput> createDefaultAudioInput() override;
  std::shared_ptr<AudioDataOutput> createAudioDataOutput() override;
  AudioSession& audioSession() override;
  /// Tells the audio session's observer, in the calling thread. Offered to a device whose audio policy interrupts; no
  /// sound server here does.
  void postInterruption(AudioSessionInterruption type);

 private:
  class Session;
  const MicrophoneSource microphone_;
  PacedClock& clock_;
  const std::unique_ptr<Session> audioSession_;
};

}  // namespace qv::platform
