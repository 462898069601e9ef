#pragma once

#include <memory>
#include <mutex>

#include "platform/AppAudioTap.h"
#include "platform/DeviceCapture.h"
#include "platform/DeviceServices.h"
#include "platform/Sounds.h"
#include "platform/headless/HeadlessPlatform.h"
#include "platform/pulse/PulsePlatform.h"

namespace qv {

/// The device's sound: PulseAudio from the moment on at which its server first answered, the headless
/// device's until then. A server that was late, or is started by the first user of a device, is looked
/// for when a recording opens its tap or its microphone; a log line tells which sound there is.
///
/// From then on the server may come and go: PulseAudio's own sources see to that.
///
/// Threading: thread-safe. Opening waits for a server that does not answer, a second at most; where
/// there is none it does not wait.
class SoundChoice final : public platform::AppAudioTapService,
                          public platform::DeviceCaptureService,
                          public platform::SystemSounds {
 public:
  explicit SoundChoice(platform::HeadlessPlatform& headless);
  ~SoundChoice() override;

  int32_t createInputQueue(const platform::AudioStreamDescription& format, platform::AppAudioInputCallback callback,
                           uint32_t flags, std::unique_ptr<platform::AppAudioTapQueue>& queue) override;
  std::shared_ptr<platform::DeviceCaptureSession> createSession() override;
  std::shared_ptr<platform::CaptureDeviceInput> createDefaultAudioInput() override;
  std::shared_ptr<platform::AudioDataOutput> createAudioDataOutput() override;
  platform::AudioSession& audioSession() override;
  void play(uint32_t soundID) override;
  /// Asks the server whether it answers now, and takes it up like a recording's start.
  [[nodiscard]] platform::ServiceState state();

 private:
  class BothAudioSessions;
  /// Takes up the server if it answers by now.
  void look();
  [[nodiscard]] platform::PulsePlatform* pulse();
  [[nodiscard]] platform::DeviceCaptureService& deviceCapture();

  platform::HeadlessPlatform& headless_;
  const std::unique_ptr<BothAudioSessions> audioSession_;
  std::mutex mutex_;
  std::unique_ptr<platform::PulsePlatform> pulse_;  // guarded by mutex_; set once, and then stays
};

}  // namespace qv
