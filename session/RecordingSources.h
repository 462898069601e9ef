#pragma once

#include <memory>
#include <optional>

#include "capture/AppAudioLease.h"
#include "capture/MicrophoneLease.h"
#include "capture/QVScreenSource.h"
#include "platform/base/Value.h"

namespace qv {

/// The leases of one stretch of a recording, from a start or resume to the next stop. Its end ends them: what was heard
/// up to then has been delivered.
///
/// Threading: none of its own. It must not end on a capture thread, nor with a lock held that a sample's way takes.
struct RecordingSources {
  RecordingSources() = default;
  RecordingSources(const RecordingSources&) = delete;
  RecordingSources& operator=(const RecordingSources&) = delete;
  ~RecordingSources() {
    // The tap's end is waited for together with the others'.
    if (appAudio) appAudio->beginStoppingAppAudioCapture();
    screen.reset();
    microphone.reset();
    appAudio.reset();
  }

  std::shared_ptr<AppAudioLease> appAudio;
  std::shared_ptr<ScreenLease> screen;
  std::unique_ptr<MicrophoneLease> microphone;
  /// The wall-clock time at which the stretch began.
  std::optional<platform::Date> captureStartTime;
};

}  // namespace qv
