#include "capture/QVCaptureManager.h"
#include "platform/Log.h"

namespace qv {

using platform::Date;
using platform::MediaTime;
using platform::SampleBufferRef;
namespace logs = platform::logs;

void QVCaptureManager::startMicrophoneCaptureWithOutput(OutputHandler outputHandler, DidStartHandler didStartHandler) {
  audioDispatchQueue_.async(
      [this, outputHandler = std::move(outputHandler), didStartHandler = std::move(didStartHandler)]() mutable {
        attachMicrophone(std::move(outputHandler), std::move(didStartHandler));
      });
}

void QVCaptureManager::attachMicrophone(OutputHandler outputHandler, DidStartHandler didStartHandler) {
  if (recordingMicrophone_) return;
  QV_LOG(logs::kCapture, "QVCaptureManager: setAudioCaptureEnabled: YES");
  startCaptureSession();
  const auto session = captureSession_.load();
  if (!session) return;
  session->setUsesApplicationAudioSession(true);
  session->setAutomaticallyConfiguresApplicationAudioSession(false);
  if (outputHandler) microphoneOutputHandler_.store(std::move(outputHandler));
  recordingMicrophone_ = true;

  auto input = platform_.deviceCapture->createDefaultAudioInput();
  captureDeviceAudioInput_.store(input);
  if (session->canAddInput(input)) session->addInput(std::move(input));

  auto output = platform_.deviceCapture->createAudioDataOutput();
  captureSessionAudioDataOutput_.store(output);
  if (output) output->setSampleDelegate(this, &sessionSampleBufferQueue_);
  if (session->canAddOutput(output)) session->addOutput(std::move(output));

  micDidStartHandler_.store(std::move(didStartHandler));
  if (session->isRunning()) {
    runMicDidStartHandler();
    return;
  }
  session->setRunningObserver([this, observed = std::weak_ptr(session)] {
    runMicDidStartHandler();
    if (const auto running = observed.lock()) running->setRunningObserver(nullptr);
  });
  session->startRunning();
}

void QVCaptureManager::runMicDidStartHandler() {
  if (const DidStartHandler handler = micDidStartHandler_.exchange(nullptr)) handler();
}

void QVCaptureManager::stopMicrophoneCapture() {
  audioDispatchQueue_.sync([this] {
    if (!recordingMicrophone_) return;
    QV_LOG(logs::kCapture, "QVCaptureManager: setAudioCaptureEnabled: NO");
    recordingMicrophone_ = false;
    const auto session = captureSession_.load();
    if (!session) return;
    session->removeInput(captureDeviceAudioInput_.load());
    session->removeOutput(captureSessionAudioDataOutput_.load());
  });
}

void QVCaptureManager::setCaptureSessionVideoDataOutput(std::shared_ptr<platform::VideoDataOutput> output) {
  if (output) output->setSampleDelegate(this, &sessionSampleBufferQueue_);
  captureSessionVideoDataOutput_.store(std::move(output));
}

void QVCaptureManager::captureOutputDidOutputSampleBuffer(const platform::CaptureOutput& output,
                                                          const SampleBufferRef& sample) {
  if (&output == captureSessionAudioDataOutput_.load().get()) {
    const OutputHandler handler = microphoneOutputHandler_.load();
    if (!handler) return;
    checkAndHandleMicInterruption();
    lastMicAudioDate_.store(Date{platform_.clock->now().secondsSince1970 + sample->duration().seconds()});
    micInterruptionPresentationTimeStamp_.store(sample->presentationTime() + sample->duration());
    handler(sample);
  } else if (&output == captureSessionVideoDataOutput_.load().get()) {
    if (const OutputHandler handler = cameraOutputHandler_.load()) handler(sample);
  }
}

void QVCaptureManager::handleAudioSessionInterruption(uint32_t type) {
  if (type == static_cast<uint32_t>(platform::AudioSessionInterruption::Began)) {
    QV_LOG(logs::kCapture, "QVCaptureManager: audio session interruption began");
    micInterrupted_ = true;
  } else if (type == static_cast<uint32_t>(platform::AudioSessionInterruption::Ended)) {
    QV_LOG(logs::kCapture, "QVCaptureManager: audio session interruption ended");
  }
}

void QVCaptureManager::checkAndHandleMicInterruption() {
  if (!micInterrupted_) return;
  const OutputHandler handler = microphoneOutputHandler_.load();
  if (!handler) return;
  micInterrupted_ = false;
  const std::optional<Date> last = lastMicAudioDate_.load();
  if (!last) return;
  const double gap = platform_.clock->now().secondsSince1970 - last->secondsSince1970;
  if (!(gap > 0.0)) return;
  QV_LOG(logs::kCapture, "gap since last mic tap, filling with empty sample buffer");
  handler(createEmptyAudioSampleBuffer(micInterruptionPresentationTimeStamp_.load(), gap));
}

}  // namespace qv
