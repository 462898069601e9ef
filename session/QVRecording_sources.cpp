#include <utility>

#include "platform/threads/Log.h"
#include "session/QVRecording.h"
#include "support/QVBundleTexts.h"

namespace qv {

using platform::DisplayCloneMode;
using platform::SampleBufferRef;
namespace logs = platform::logs;

namespace {
constexpr int32_t kFrameRate = 60;
constexpr int32_t kBroadcastFrameRate = 30;
}  // namespace

/// "Still recording? Then start the sources" is one step: what ends the recording comes before it or after it.
void QVRecording::_resumeOrStartSession() {
  std::lock_guard lock(shouldStopLock_);
  if (state_ == State::Paused) timing_.resumed();
  if (state_ != State::Paused && state_ != State::Preparing) return;
  state_ = State::Running;
  sources_ = startSources();
}

ScreenRequest QVRecording::screenRequest() const {
  ScreenRequest request;
  request.mode = settings_.systemRecording ? DisplayCloneMode::MirrorScreen : DisplayCloneMode::CloneContexts;
  if (!settings_.systemRecording) request.contextIDs = {contextIDs_.begin(), contextIDs_.end()};
  request.size = settings_.windowSize;
  request.frameRate = settings_.broadcast ? kBroadcastFrameRate : kFrameRate;
  return request;
}

std::unique_ptr<RecordingSources> QVRecording::startSources() {
  auto sources = std::make_unique<RecordingSources>();
  const ScreenRequest request = screenRequest();
  sources->screen = context_->screen->lease(request, weak_from_this());
  reportingAgent_->setVideoCapture(settings_.windowSize, request.frameRate);
  if (isMicrophoneWanted()) setupMicTap(*sources);
  sources->appAudio =
      context_->captureManager.leaseAppAudio([weakSelf = weak_from_this()](const SampleBufferRef& sample) {
        if (const auto self = weakSelf.lock()) self->handleAppAudio(sample);
      });
  if (frontmostPIDForAudioTap_ < 1) {
    sources->screen->startCapture();
  } else {
    // The screen starts when the sound does, so that the movie's first picture has its sound.
    sources->appAudio->startAppAudioCaptureForProcessID(frontmostPIDForAudioTap_,
                                                        [weakScreen = std::weak_ptr(sources->screen)] {
                                                          if (const auto screen = weakScreen.lock())
                                                            screen->startCapture();
                                                        });
  }
  sources->captureStartTime = context_->platform.clock->now();
  return sources;
}

/// An application's recording has the microphone that its user allowed at the start, silent while it is switched off;
/// so a switch in mid-recording asks nobody and opens nothing. A host of a broadcast may switch it on at any time.
bool QVRecording::isMicrophoneWanted() const {
  if (settings_.systemRecording) return microphoneEnabled_;
  return settings_.microphoneEnabled || settings_.broadcast.has_value();
}

void QVRecording::setupMicTap(RecordingSources& sources) {
  if (sources.microphone || !context_->captureManager.hasAudioCaptureDevice()) return;
  QV_LOG(logs::kSession, "starting mic capture");
  sources.microphone = context_->captureManager.startMicrophoneCaptureWithOutput(
      [weakSelf = weak_from_this()](const SampleBufferRef& sample) {
        if (const auto self = weakSelf.lock()) self->handleMicrophone(sample);
      },
      nullptr);
}

void QVRecording::stopAllCapture(std::unique_ptr<RecordingSources> sources) {
  if (!sources) return;
  QV_LOG(logs::kSession, "QVRecordingSession: stopAllCapture");
  if (const auto started = sources->captureStartTime) {
    reportingAgent_->addActiveDuration(context_->platform.clock->now().secondsSince1970 - started->secondsSince1970);
  }
}

/// Off, the microphone's track goes on with silence. A system recording takes the microphone when it is first on.
void QVRecording::setMicrophoneEnabled(bool enabled) {
  std::lock_guard lock(shouldStopLock_);
  microphoneEnabled_ = enabled;
  if (enabled && settings_.systemRecording && state_ == State::Running) setupMicTap(*sources_);
}

void QVRecording::updateProcessIDForAudioCaptureWithPID(int32_t processID) {
  QV_LOG(logs::kSession, "updateProcessIDForAudioCaptureWithPID: %i", processID);
  std::shared_ptr<AppAudioLease> appAudio;
  std::weak_ptr<ScreenLease> weakScreen;
  {
    std::lock_guard lock(shouldStopLock_);
    if (state_ >= State::Ending) return;
    frontmostPIDForAudioTap_ = processID;
    // Paused, nothing is tapped; the resume taps the new process.
    if (sources_) {
      appAudio = sources_->appAudio;
      weakScreen = sources_->screen;
    }
  }
  QV_LOG(logs::kSession, "stopping audio capture");
  if (appAudio) appAudio->stopAppAudioCapture();
  const auto startScreen = [weakScreen] {
    if (const auto screen = weakScreen.lock()) screen->startCapture();
  };
  if (processID < 1) {
    QV_LOG(logs::kSession, "invalid pid stopping audio capture");
    startScreen();
    return;
  }
  QV_LOG(logs::kSession, "update foreground app bundleId");
  updateBundleIdForFirstForegroundApp();
  if (!appAudio) return;
  QV_LOG(logs::kSession, "resuming audio capture for pid: %i", processID);
  appAudio->resumeAppAudioCaptureForProcessID(processID, [startScreen, processID] {
    QV_LOG_DEBUG(logs::kSession, "resumed audio capture for pid: %i", processID);
    startScreen();
  });
}

void QVRecording::checkAndStopAppAudioForPID(int32_t processID) {
  std::shared_ptr<AppAudioLease> appAudio;
  {
    std::lock_guard lock(shouldStopLock_);
    if (frontmostPIDForAudioTap_ == processID && sources_) appAudio = sources_->appAudio;
  }
  if (appAudio) appAudio->stopAppAudioCapture();
}

/// Only the first application of a broadcast is told to its extension.
void QVRecording::updateBundleIdForFirstForegroundApp() {
  if (!settings_.broadcast || bundleIDOfFirstForegroundApp_) return;
  const auto bundle = context_->texts.bundleWithPID(frontmostPIDForAudioTap());
  if (!bundle) return;
  bundleIDOfFirstForegroundApp_ = bundle->bundleIdentifier();
  output_->tellFrontmostApplication(bundle->bundleIdentifier());
}

}  // namespace qv
