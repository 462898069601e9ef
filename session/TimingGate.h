#pragma once

#include "session/RecordingOutput.h"

namespace qv {

/// The timeline of one recording: a pause leaves no gap in it. The first picture after a resume takes the time of the
/// last one before the pause; several pauses add up. Sound is never touched: it comes with its capture time and the sum
/// of the pauses.
///
/// All times are capture times, on the host clock, unless they say otherwise.
///
/// Threading: none of its own; the recording's lock is held.
class TimingGate {
 public:
  /// The next picture closes a pause. A pause before the first picture leaves nothing to close.
  void resumed() { sessionWasResumed_ = lastSampleTimestamp_.isValid(); }
  /// A picture in the recording's timeline.
  [[nodiscard]] PlacedPicture place(const platform::SampleBufferRef& sample, uint64_t transformFlags);
  /// From the first picture, of this time, to the last one, less the pauses between them. Zero without a picture.
  [[nodiscard]] platform::MediaTime recorded(platform::MediaTime first) const;
  /// The pauses that are closed.
  [[nodiscard]] platform::MediaTime pauses() const { return sampleTimeOffset_; }
  /// Whether a pause waits for its first picture: what is heard meanwhile belongs to the pause.
  [[nodiscard]] bool isInPause() const { return sessionWasResumed_; }
  /// The presentation time of an end at this time; invalid without a picture.
  [[nodiscard]] platform::MediaTime endTime(platform::MediaTime stoppedAt) const;

 private:
  void accountForPause(platform::MediaTime presentationTime);

  bool sessionWasResumed_ = false;
  platform::MediaTime lastSampleTimestamp_ = platform::MediaTime::invalid();
  platform::MediaTime sampleTimeOffset_ = platform::MediaTime::zero();
};

}  // namespace qv
