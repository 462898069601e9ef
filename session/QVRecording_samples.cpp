#include "platform/threads/Log.h"
#include "session/ClipSeam.h"
#include "session/QVRecording.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::MediaTime;
using platform::SampleBufferRef;
namespace logs = platform::logs;

/// Seconds since the first picture.
void QVRecording::updateDuartionWithSample(const SampleBufferRef& sample) {
  MediaTime first;
  {
    std::lock_guard lock(shouldStopLock_);
    first = firstSampleTimestamp_;
  }
  const MediaTime time = sample->presentationTime();
  const MediaTime elapsed = MediaTime::make(time.value - first.value, time.timescale);
  if (const auto observer = observer_.lock()) observer->recordingDidUpdateDuration(elapsed.seconds());
}

void QVRecording::screenCaptureControllerDidReceiveSampleBuffer(platform::ScreenCaptureController&,
                                                                const SampleBufferRef& sample,
                                                                uint64_t transformFlags) {
  if (!sample) return;
  QV_LOG_DEBUG(logs::kSession, "Screen sampled at w:%zu h:%zu", sample->image()->width(), sample->image()->height());
  {
    std::lock_guard lock(shouldStopLock_);
    if (firstSampleTimestamp_ == MediaTime::zero()) firstSampleTimestamp_ = sample->presentationTime();
  }
  updateDuartionWithSample(sample);
  _processSampleBuffer(sample, transformFlags);
}

void QVRecording::_processSampleBuffer(const SampleBufferRef& sample, uint64_t transformFlags) {
  QV_LOG_DEBUG(logs::kSession, "QVRecordingSession:screenCaptureController:didReceiveSampleBuffer:transformFlags:");
  bool accepted = true;
  std::optional<platform::Error> failure;
  {
    std::lock_guard lock(shouldStopLock_);
    if (state_ == State::Paused) QV_LOG(logs::kSession, "session is paused discard sample");
    if (state_ != State::Running) return;
    AppAudioLease& appAudio = *sources_->appAudio;
    if (appAudio.captureStartTime() == MediaTime::invalid()) {
      appAudio.setCaptureStartTime(sample->presentationTime());
    }
    accepted = output_->appendVideo(timing_.place(sample, transformFlags));
    if (!accepted) failure = output_->failure();
    reportingAgent_->addVideoFrame();
  }
  if (accepted) return;
  QV_LOG_ERROR(logs::kSession, "QVRecordingSession: failed to start writer when appending video sample");
  fail(errorOfFailedWrite(failure));
}

/// Sound comes later than it was captured: a pause and the end leave out only what was captured after they began. What
/// is heard between a resume and its first picture belongs to the pause.
std::optional<PlacedSound> QVRecording::placeSound(const SampleBufferRef& sample) const {
  std::lock_guard lock(shouldStopLock_);
  // There are no sources then.
  if (state_ == State::Preparing || state_ == State::Ended) return std::nullopt;
  if (state_ == State::Running && timing_.isInPause()) return std::nullopt;
  PlacedSound placed{sample, timing_.pauses()};
  const bool hasTime = sample->presentationTime() > MediaTime::zero();
  if (state_ != State::Running && hasTime) placed.sample = splitSound(sample, stoppedAt_).before;
  return placed.sample ? std::optional(placed) : std::nullopt;
}

void QVRecording::handleAppAudio(const SampleBufferRef& sample) {
  if (!sample) return;
  updateDuartionWithSample(sample);
  const auto heard = placeSound(sample);
  if (!heard) return;
  output_->appendAppAudio(*heard);
  reportingAgent_->addAppAudioFrame();
}

void QVRecording::handleMicrophone(const SampleBufferRef& sample) {
  if (!sample) return;
  updateDuartionWithSample(sample);
  auto heard = placeSound(sample);
  if (!heard) return;
  // Muted, the track goes on with silence.
  if (!microphoneEnabled()) heard->sample = platform::SampleBuffer::silencedCopy(heard->sample);
  output_->appendMicrophone(*heard);
  reportingAgent_->addMicFrame();
}

void QVRecording::screenCaptureControllerDidFailWithStatus(platform::ScreenCaptureController&, int32_t) {
  QV_LOG_ERROR(logs::kSession, "QVRecordingSession: screenCaptureController: didFailWithStatus:");
  fail(recordingError(errorcode::kMediaServicesFailed));
}

void QVRecording::screenCaptureControllerWasPreempted(platform::ScreenCaptureController&) {
  QV_LOG(logs::kSession, "QVRecordingSession: screenCaptureControllerWasPreempted");
  fail(recordingError(errorcode::kInterrupted));
}

void QVRecording::screenCaptureControllerMediaServicesWereReset(platform::ScreenCaptureController&) {
  QV_LOG_ERROR(logs::kSession, "QVRecordingSession: screenCaptureControllerMediaServicesWereReset");
  fail(recordingError(errorcode::kMediaServicesFailed));
}

}  // namespace qv
