#pragma once

#include <limits>
#include <optional>

#include "sdk/common/quorvel/Types.h"

namespace qv::extension {

/// Takes pauses out of the times of sound, as the daemon took them out of the times of pictures.
///
/// Pictures do not say when they were captured. But they come in soon after that, so how late a picture comes in is
/// its delivery time and the pauses so far; the least of it, compared with the least before any pause, is the pauses.
///
/// Threading: one thread at a time. All times on CLOCK_MONOTONIC.
class PauseTimeline {
 public:
  using Time = quorvel::SampleTime;

  void paused(Time now);
  void resumed(Time now);
  void notePicture(Time presentation, Time now);
  /// The presentation time of sound captured at `captured`; nothing for sound from within a pause.
  [[nodiscard]] std::optional<Time> place(Time captured) const;

 private:
  static constexpr Time kNone = Time::max();

  Time delivery_ = kNone;  // the least seen before any pause
  Time least_ = kNone;     // how late a picture came in at the least, since the last resume
  Time lastPicture_{0};    // presentation
  Time shift_{0};          // the pauses so far
  Time formerShift_{0};    // before the last pause
  Time pausedAt_ = kNone, resumedAt_{0};
};

}  // namespace qv::extension
