#include "platform/Log.h"
#include "session/QVRecordingSession.h"

namespace qv {

using platform::DisplayCloneMode;
using platform::MediaTime;
using platform::Platform;
namespace logs = platform::logs;

namespace {
constexpr int32_t kFrameRate = 60;
constexpr int32_t kBroadcastFrameRate = 30;
}  // namespace

void QVRecordingSession::_resumeOrStartSession() {
  platform::DisplayCloneService& displayClone = Platform::current().screenCapture->displayClone();
  if (systemRecording_) {
    QV_LOG(logs::kSession, "mirror mode");
    displayClone.setMirroringMode(DisplayCloneMode::MirrorScreen);
  } else {
    QV_LOG(logs::kSession, "quorvel mode");
    displayClone.setCloneContexts({contextIDs_.begin(), contextIDs_.end()});
    displayClone.setMirroringMode(DisplayCloneMode::CloneContexts);
  }
  const int32_t frameRate = hasBroadcastExtension() ? kBroadcastFrameRate : kFrameRate;
  if (const auto agent = reportingAgent()) agent->setVideoCapture(windowSize_, frameRate);
  prepareScreenCapture(frameRate);

  const bool wantsMicrophone = microphoneEnabled_ || (!systemRecording_ && hasBroadcastExtension());
  if (captureManager_.hasAudioCaptureDevice() && wantsMicrophone) setupMicTap();

  const uint64_t stretch = screenCapture_.with([](ScreenCapture& capture) { return capture.stretch; });
  if (frontmostPIDForAudioTap_ < 1) {
    startScreenCapture(stretch);
  } else {
    captureManager_.startAppAudioCaptureForProcessID(
        frontmostPIDForAudioTap_,
        [weakSelf = weak_from_this()](const platform::SampleBufferRef& sample) {
          if (const auto self = weakSelf.lock()) self->handleAppAudio(sample);
        },
        [weakSelf = weak_from_this(), stretch] {
          if (const auto self = weakSelf.lock()) self->startScreenCapture(stretch);
        });
  }
  captureStartTime_.store(Platform::current().clock->now());
}

/// Keeps the controller of the last recording while its size and rate still fit.
void QVRecordingSession::prepareScreenCapture(int32_t frameRate) {
  screenCapture_.with([&](ScreenCapture& capture) {
    if (!capture.controller || !(capture.size == windowSize_) || capture.frameRate != frameRate) {
      capture.controller =
          Platform::current().screenCapture->createController(windowSize_, MediaTime::make(1, frameRate));
      capture.size = windowSize_;
      capture.frameRate = frameRate;
    }
    if (capture.controller) capture.controller->setDelegate(weak_from_this());
  });
}

void QVRecordingSession::startScreenCapture(uint64_t stretch) {
  screenCapture_.with([&](ScreenCapture& capture) {
    if (capture.stretch != stretch || !capture.controller) return;
    QV_LOG(logs::kSession, "starting capture with VellCaptureController");
    capture.controller->startCapture();
  });
}

void QVRecordingSession::stopAllCapture() {
  QV_LOG(logs::kSession, "QVRecordingSession: stopAllCapture");
  const auto started = captureStartTime_.exchange(std::nullopt);
  const auto agent = reportingAgent();
  if (started && agent) {
    agent->addActiveDuration(Platform::current().clock->now().secondsSince1970 - started->secondsSince1970);
  }
  const auto controller = screenCapture_.with([](ScreenCapture& capture) {
    ++capture.stretch;
    return capture.controller;
  });
  if (controller) {
    controller->stopCapture();
    controller->setDelegate({});
  }
  captureManager_.stopAllCapture();
  QV_LOG(logs::kSession, "Stop mirroring");
  Platform::current().screenCapture->displayClone().setMirroringMode(DisplayCloneMode::Off);
  haveMicTap_ = false;
}

}  // namespace qv
