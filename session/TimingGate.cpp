#include "session/TimingGate.h"

#include <utility>
#include <vector>

#include "platform/threads/Log.h"

namespace qv {

using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;
namespace logs = platform::logs;

namespace {

/// All pictures of a recording share one timescale.
MediaTime difference(const MediaTime& a, const MediaTime& b) { return MediaTime::make(a.value - b.value, a.timescale); }

SampleBufferRef _copySampleBufferFromSourceBuffer(const SampleBufferRef& sample, MediaTime updatedTimeStamp) {
  size_t bytes = 0;
  if (__builtin_mul_overflow(sample->timing().size(), sizeof(platform::SampleTimingInfo), &bytes)) {
    QV_LOG_ERROR(logs::kSession, "QVRecordingSession: _copySampleBufferFromSourceBuffer: Overflow detected");
    return nullptr;
  }
  std::vector<platform::SampleTimingInfo> timing(sample->timing().begin(), sample->timing().end());
  for (platform::SampleTimingInfo& entry : timing) {
    entry.presentationTimeStamp = updatedTimeStamp;
    entry.decodeTimeStamp = MediaTime::invalid();
  }
  return SampleBuffer::copyWithNewTiming(sample, std::move(timing));
}

/// The sample itself where nothing is to be taken off, and where it cannot be copied.
SampleBufferRef _updateSampleBufferWithOffset(const SampleBufferRef& sample, MediaTime offset) {
  if (offset == MediaTime::zero()) return sample;
  const auto copy = _copySampleBufferFromSourceBuffer(sample, difference(sample->presentationTime(), offset));
  return copy ? copy : sample;
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
  sampleTimeOffset_ = sampleTimeOffset_ == MediaTime::zero()
                          ? gap
                          : MediaTime::make(sampleTimeOffset_.value + gap.value, gap.timescale);
}

MediaTime TimingGate::recorded(MediaTime first) const {
  return lastSampleTimestamp_.isValid() ? lastSampleTimestamp_ - first - sampleTimeOffset_ : MediaTime::zero();
}

MediaTime TimingGate::endTime(MediaTime stoppedAt) const {
  if (!lastSampleTimestamp_.isValid()) return MediaTime::invalid();
  return (stoppedAt - sampleTimeOffset_).convertedTo(lastSampleTimestamp_.timescale);
}

}  // namespace qv
