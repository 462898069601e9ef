#include <utility>

#include "platform/Log.h"
#include "session/QVRecordingSession.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::AffineTransform;
using platform::MediaTime;
using platform::SampleBufferRef;
namespace logs = platform::logs;

namespace {

constexpr uint64_t kRotate = 4;
constexpr uint64_t kFlipX = 2;
constexpr uint64_t kFlipY = 1;

MediaTime difference(const MediaTime& a, const MediaTime& b) { return MediaTime::make(a.value - b.value, a.timescale); }

}  // namespace

uint32_t orientationFromVellTransform(uint64_t transformFlags) {
  static constexpr uint32_t kOrientations[] = {1, 4, 2, 3, 8, 5, 7, 6};
  return transformFlags < 8 ? kOrientations[transformFlags] : 1;
}

AffineTransform _affineTransformFromVellTransformFlags(uint64_t transformFlags) {
  AffineTransform transform = AffineTransform::identity();
  if (transformFlags & kRotate) {
    QV_LOG_DEBUG(logs::kSession, "rotate clockwise");
    // A quarter turn by exact values: cos is 0 and sin 1.
    transform = concatenate(transform, {0, 1, -1, 0, 0, 0});
  }
  if (transformFlags & kFlipX) {
    QV_LOG_DEBUG(logs::kSession, "flip x");
    transform.a = transform.a == 0 ? 0 : -transform.a;
    transform.b = transform.b == 0 ? 0 : -transform.b;
  }
  if (transformFlags & kFlipY) {
    QV_LOG_DEBUG(logs::kSession, "flip y");
    transform.c = transform.c == 0 ? 0 : -transform.c;
    transform.d = transform.d == 0 ? 0 : -transform.d;
  }
  return transform;
}

void QVRecordingSession::screenCaptureControllerDidReceiveSampleBuffer(platform::ScreenCaptureController&,
                                                                       const SampleBufferRef& sample,
                                                                       uint64_t transformFlags) {
  if (!sample) return;
  QV_LOG_DEBUG(logs::kSession, "Screen sampled at w:%zu h:%zu", sample->image()->width(), sample->image()->height());
  firstSampleTimestamp_.with([&](MediaTime& first) {
    if (first == MediaTime::zero()) first = sample->presentationTime();
  });
  updateDuartionWithSample(sample);
  _processSampleBuffer(sample, transformFlags);
}

void QVRecordingSession::_processSampleBuffer(const SampleBufferRef& sample, uint64_t transformFlags) {
  QV_LOG_DEBUG(logs::kSession, "QVRecordingSession:screenCaptureController:didReceiveSampleBuffer:transformFlags:");
  bool refused = false;
  {
    std::lock_guard lock(shouldStopLock_);
    if (shouldStop_) return;
    if (paused_) {
      QV_LOG(logs::kSession, "session is paused discard sample");
      return;
    }
    const MediaTime time = sample->presentationTime();
    accountForPause(time);
    _updateSampleBufferWithOffset(
        sample, [&](const SampleBufferRef& rebased) { refused = !deliverVideo(rebased, time, transformFlags); });
  }
  if (refused) {
    QV_LOG_ERROR(logs::kSession, "QVRecordingSession: failed to start writer when appending video sample");
    stopRecordingWithNotification(true, _qvUserErrorForCode(errorcode::kFailedToSave));
  }
}

/// The first frame after a resume takes the time of the last frame before the pause; offsets of several
/// pauses add up. The last time is always a frame's own, so a pause right after that first frame
/// counts from it.
void QVRecordingSession::accountForPause(MediaTime time) {
  const MediaTime last = std::exchange(lastSampleTimestamp_, time);
  if (!std::exchange(sessionWasResumed_, false)) return;
  const MediaTime gap = difference(time, last);
  sampleTimeOffset_ = sampleTimeOffset_ == MediaTime::zero()
                          ? gap
                          : MediaTime::make(sampleTimeOffset_.value + gap.value, gap.timescale);
}

void QVRecordingSession::_updateSampleBufferWithOffset(const SampleBufferRef& sample,
                                                       const std::function<void(const SampleBufferRef&)>& handler) {
  if (!(sampleTimeOffset_ == MediaTime::zero())) {
    const MediaTime time = sample->presentationTime();
    if (const auto copy = _copySampleBufferFromSourceBuffer(sample, difference(time, sampleTimeOffset_))) {
      captureManager_.setCaptureStartTime(time);
      handler(copy);
      return;
    }
  }
  handler(sample);
}

SampleBufferRef QVRecordingSession::_copySampleBufferFromSourceBuffer(const SampleBufferRef& sample,
                                                                      MediaTime updatedTimeStamp) {
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
  return platform::SampleBuffer::copyWithNewTiming(sample, std::move(timing));
}

bool QVRecordingSession::deliverVideo(const SampleBufferRef& sample, MediaTime unadjustedTime,
                                      uint64_t transformFlags) {
  if (captureManager_.captureStartTime() == MediaTime::invalid()) captureManager_.setCaptureStartTime(unadjustedTime);
  const AffineTransform transform =
      systemRecording_ ? _affineTransformFromVellTransformFlags(transformFlags) : AffineTransform::identity();
  bool accepted = true;
  if (broadcastProcessMode_ == BroadcastProcessMode::Samples) {
    _notifyExtensionOfVideoSampleBuffer(sample, SampleType::Video, orientationFromVellTransform(transformFlags));
  } else if (captureRecording_) {
    packageVideoSampleBufferForCapture(sample);
  } else if (isCuttingClips()) {
    accepted = appendVideoToClip(sample, transform);
  } else if (const auto writer = movieWriter()) {
    accepted = writer->appendVideoSampleBuffer(sample, transform);
  }
  if (const auto agent = reportingAgent()) agent->addVideoFrame();
  return accepted;
}

void QVRecordingSession::screenCaptureControllerDidFailWithStatus(platform::ScreenCaptureController&, int32_t) {
  QV_LOG_ERROR(logs::kSession, "QVRecordingSession: screenCaptureController: didFailWithStatus:");
  stopRecordingWithNotification(true, _qvUserErrorForCode(errorcode::kMediaServicesFailed));
}

void QVRecordingSession::screenCaptureControllerWasPreempted(platform::ScreenCaptureController&) {
  QV_LOG(logs::kSession, "QVRecordingSession: screenCaptureControllerWasPreempted");
  stopRecordingWithNotification(true, _qvUserErrorForCode(errorcode::kInterrupted));
}

void QVRecordingSession::screenCaptureControllerMediaServicesWereReset(platform::ScreenCaptureController&) {
  QV_LOG_ERROR(logs::kSession, "QVRecordingSession: screenCaptureControllerMediaServicesWereReset");
  {
    std::lock_guard lock(shouldStopLock_);
    shouldStop_ = true;
  }
  stopRecordingWithNotification(true, _qvUserErrorForCode(errorcode::kMediaServicesFailed));
}

}  // namespace qv
