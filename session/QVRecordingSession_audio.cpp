#include "platform/Log.h"
#include "session/QVRecordingSession.h"
#include "support/QVExtensions.h"

namespace qv {

using platform::MediaTime;
using platform::SampleBufferRef;
namespace logs = platform::logs;

/// Seconds since the first frame that this session saw.
void QVRecordingSession::updateDuartionWithSample(const SampleBufferRef& sample) {
  const MediaTime time = sample->presentationTime();
  const MediaTime elapsed = MediaTime::make(time.value - firstSampleTimestamp_.load().value, time.timescale);
  if (const auto delegate = delegate_.load().lock()) {
    delegate->broadcastSessionDidUpdateDuration(*this, elapsed.seconds());
  }
}

/// Sound comes later than it was captured, so a pause leaves out only what was captured after it began.
SampleBufferRef QVRecordingSession::soundBeforePause(const SampleBufferRef& sample) const {
  return paused_ ? splitSound(sample, pauseTime_.load()).before : sample;
}

void QVRecordingSession::handleAppAudio(const SampleBufferRef& sample) {
  if (!sample) return;
  updateDuartionWithSample(sample);
  if (const SampleBufferRef heard = soundBeforePause(sample)) routeAppAudio(heard);
}

void QVRecordingSession::routeAppAudio(const SampleBufferRef& sample) {
  if (broadcastProcessMode_ == BroadcastProcessMode::Samples) {
    _notifyExtensionOfAudioSampleBuffer(sample, SampleType::AppAudio);
  } else if (isCuttingClips()) {
    _processAudioSampleBufferForMP4ClipHandler(sample);
  } else if (captureRecording_) {
    packageAudioSampleBufferForCapture(sample, SampleType::AppAudio);
  } else if (const auto writer = movieWriter()) {
    writer->appendAudio1SampleBuffer(sample);
  }
  if (const auto agent = reportingAgent()) agent->addAppAudioFrame();
}

void QVRecordingSession::setupMicTap() {
  QV_LOG(logs::kSession, "starting mic capture");
  captureManager_.startMicrophoneCaptureWithOutput(
      [weakSelf = weak_from_this()](const SampleBufferRef& sample) {
        if (const auto self = weakSelf.lock()) self->handleMicrophone(sample);
      },
      [weakSelf = weak_from_this()] {
        if (const auto self = weakSelf.lock()) self->haveMicTap_ = true;
      });
}

void QVRecordingSession::handleMicrophone(const SampleBufferRef& sample) {
  if (!sample) return;
  updateDuartionWithSample(sample);
  const SampleBufferRef recorded = soundBeforePause(sample);
  if (!recorded) return;
  // Muted, the track goes on with silence.
  const SampleBufferRef heard = microphoneEnabled_ ? recorded : platform::SampleBuffer::silencedCopy(recorded);
  if (broadcastProcessMode_ == BroadcastProcessMode::Samples) {
    _notifyExtensionOfAudioSampleBuffer(heard, SampleType::Microphone);
  } else if (captureRecording_) {
    packageAudioSampleBufferForCapture(heard, SampleType::Microphone);
  } else if (isCuttingClips()) {
    appendMicrophoneToClip(heard);
  } else if (const auto writer = movieWriter()) {
    writer->appendAudio2SampleBuffer(heard);
  }
  if (const auto agent = reportingAgent()) agent->addMicFrame();
}

void QVRecordingSession::setMicrophoneEnabled(bool enabled) {
  microphoneEnabled_ = enabled;
  if (enabled && !haveMicTap_ && systemRecording_ && recording_ && captureManager_.hasAudioCaptureDevice()) {
    setupMicTap();
  }
}

void QVRecordingSession::updateProcessIDForAudioCaptureWithPID(int32_t processID) {
  QV_LOG(logs::kSession, "updateProcessIDForAudioCaptureWithPID: %i", processID);
  if (!recording_) return;
  frontmostPIDForAudioTap_ = processID;
  QV_LOG(logs::kSession, "stopping audio capture");
  if (processID < 1) {
    QV_LOG(logs::kSession, "invalid pid stopping audio capture");
    captureManager_.stopAppAudioCapture();
    return;
  }
  captureManager_.stopAppAudioCapture();
  QV_LOG(logs::kSession, "update foreground app bundleId");
  updateBundleIdForFirstForegroundApp();
  // Paused, nothing is tapped; the resume taps the new process.
  if (paused_) return;
  QV_LOG(logs::kSession, "resuming audio capture for pid: %i", processID);
  captureManager_.resumeAppAudioCaptureForProcessID(
      processID, [weakSelf = weak_from_this(), processID](const SampleBufferRef& sample) {
        QV_LOG_DEBUG(logs::kSession, "resumed audio capture for pid: %i", processID);
        const auto self = weakSelf.lock();
        if (!self || !sample) return;
        self->updateDuartionWithSample(sample);
        self->routeAppAudio(sample);
      });
}

void QVRecordingSession::checkAndStopAppAudioForPID(int32_t processID) {
  if (frontmostPIDForAudioTap_ == processID) captureManager_.stopAppAudioCapture();
}

/// Only the first application of a broadcast is told to its extension.
void QVRecordingSession::updateBundleIdForFirstForegroundApp() {
  if (!isBroadcasting_ || bundleIDOfFirstForegroundApp_) return;
  const auto bundle = bundleWithPID(frontmostPIDForAudioTap_);
  if (!bundle) return;
  bundleIDOfFirstForegroundApp_ = bundle->bundleIdentifier();
  if (broadcastProcessMode_ == BroadcastProcessMode::Samples) {
    _notifyExtensionOfFrontmostProcessBundleID(bundle->bundleIdentifier());
  }
}

}  // namespace qv
