#include "session/TimingGate.h"

#include <utility>

namespace qv {

using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;

namespace {

/// All pictures of a recording share one timescale.
MediaTime difference(const MediaTime& a, const MediaTime& b) { return MediaTime::make(a.value - b.value, a.timescale); }

/// The sample itself where nothing is to be taken off.
SampleBufferRef _updateSampleBufferWithOffset(const SampleBufferRef& sample, MediaTime offset) {
  if (offset == MediaTime::zero()) return sample;
  const MediaTime time = difference(sample->presentationTime(), offset);
  return SampleBuffer::copyWithNewTiming(sample, {{sample->duration(), time, MediaTime::invalid()}});
}

}  // namespace

PlacedPicture TimingGate::place(const SampleBufferRef& sample, uint64_t transformFlags) {
  accountForPause(sample->presentationTime());
  return {_updateSampleBufferWithOffset(sample, sampleTimeOffset_), transformFlags, sampleTimeOffset_};
}

/// The last time is always a picture's own, so a pause right after the first picture of a stretch counts from that one.
void TimingGate::accountForPause(MediaTime time) {
  const MediaTime last = std::exchange(lastSampleTimestamp_, time);
  if (!std::exchange(sessionWasResumed_, false)) return;
  const MediaTime gap = difference(time, last);
  sampleTimeOffset_ = MediaTime::make(sampleTimeOffset_.value + gap.value, gap.timescale);
}

MediaTime TimingGate::endTime(MediaTime stoppedAt) const {
  if (!lastSampleTimestamp_.isValid()) return MediaTime::invalid();
  return (stoppedAt - sampleTimeOffset_).convertedTo(lastSampleTimestamp_.timescale);
}

}  // namespace qv
