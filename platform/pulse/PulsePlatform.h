#pragma once

#include <memory>
#include <string>

#include "platform/Sounds.h"
#include "platform/base/Result.h"
#include "platform/sound/PacedDeviceCapture.h"
#include "platform/sound/PacedTapQueue.h"

namespace qv::platform {

/// Sound through a PulseAudio server, or one that speaks its protocol.
///
/// A connection is open, and a thread runs, only while a tap or the microphone does, or a sound
/// is played. When the server goes away a tap and the microphone continue with silence, and they
/// look for it once a second until it is back.
///
/// Threading: thread-safe. `createDefaultAudioInput` asks the server and waits for it, a second at most.
class PulsePlatform {
 public:
  /// An error where no server answers within a second. An empty `server` is the default one, which
  /// the environment may name.
  static Result<std::unique_ptr<PulsePlatform>> connect(const std::string& server = {});
  ~PulsePlatform();

  AppAudioTapService& appAudioTap() { return appAudioTap_; }
  DeviceCaptureService& deviceCapture() { return deviceCapture_; }
  SystemSounds& sounds() { return *sounds_; }

 private:
  explicit PulsePlatform(const std::string& server);

  PacedTapService appAudioTap_;
  PacedDeviceCapture deviceCapture_;
  const std::unique_ptr<SystemSounds> sounds_;
};

}  // namespace qv::platform
