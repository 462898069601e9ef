#pragma once

#include <chrono>
#include <memory>

#include "platform/SuspendMonitor.h"

namespace qv {

class QVRecordingManager;

/// After a longer sleep nobody expects the screen to be recorded still.
inline constexpr std::chrono::seconds kLongestSleepOfRecording{60};

/// What the device's sleep means for a system recording. It marks its movie's end before the sleep, and goes on
/// after a short one as if nothing had been. After a long one it ends, with the movie cut at the mark and in the
/// photo library. Applications' recordings go on in either case: whoever asked for them is in front again, and
/// the clocks of a movie stand still meanwhile.
///
/// Threading: the handlers may be called on any thread.
platform::SuspendHandlers handlersOfDeviceSleep(const std::shared_ptr<QVRecordingManager>& manager);

}  // namespace qv
