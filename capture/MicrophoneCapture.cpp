#include "capture/MicrophoneCapture.h"

#include <utility>

#include "capture/QVCaptureManager.h"
#include "platform/threads/Log.h"

namespace qv {

using platform::Date;
using platform::SampleBufferRef;
namespace logs = platform::logs;

MicrophoneCapture::MicrophoneCapture(platform::Platform& platform, QVCaptureManager& manager,
                                     std::shared_ptr<MicInterrupted> micInterrupted, OutputHandler outputHandler,
                                     DidStartHandler didStartHandler)
    : platform_(platform),
      manager_(manager),
      micInterrupted_(std::move(micInterrupted)),
      microphoneOutputHandler_(std::move(outputHandler)),
      micDidStartHandler_(std::make_shared<PendingHandler>(std::move(didStartHandler))) {
  manager_.audioDispatchQueue().async([this] { attachMicrophone(); });
}

MicrophoneCapture::~MicrophoneCapture() {
  isEnding_ = true;
  stopCaptureSession();
  stopMicrophoneCapture();
}

void MicrophoneCapture::startCaptureSession() {
  QV_LOG(logs::kCapture, "QVCaptureManager: startCaptureSession");
  captureSession_.store(platform_.deviceCapture->createSession());
}

void MicrophoneCapture::attachMicrophone() {
  if (isEnding_) return;
  QV_LOG(logs::kCapture, "QVCaptureManager: setAudioCaptureEnabled: YES");
  startCaptureSession();
  const auto session = captureSession_.load();
  if (!session) return;
  session->setUsesApplicationAudioSession(true);
  session->setAutomaticallyConfiguresApplicationAudioSession(false);
  attachInputAndOutput(*session);
  if (session->isRunning()) {
    runMicDidStartHandler(*micDidStartHandler_);
    return;
  }
  session->setRunningObserver([weakPending = std::weak_ptr(micDidStartHandler_)] {
    if (const auto pending = weakPending.lock()) runMicDidStartHandler(*pending);
  });
  session->startRunning();
}

void MicrophoneCapture::attachInputAndOutput(platform::DeviceCaptureSession& session) {
  captureDeviceAudioInput_ = platform_.deviceCapture->createDefaultAudioInput();
  if (session.canAddInput(captureDeviceAudioInput_)) session.addInput(captureDeviceAudioInput_);
  captureSessionAudioDataOutput_ = platform_.deviceCapture->createAudioDataOutput();
  if (!captureSessionAudioDataOutput_) return;
  captureSessionAudioDataOutput_->setSampleDelegate(this, &manager_.sessionSampleBufferQueue());
  if (session.canAddOutput(captureSessionAudioDataOutput_)) session.addOutput(captureSessionAudioDataOutput_);
}

void MicrophoneCapture::runMicDidStartHandler(PendingHandler& pending) {
  if (const DidStartHandler handler = pending.exchange(nullptr)) handler();
}

/// In the thread of whoever ends the lease, so that it does not wait for a tap's stop on the audio dispatch queue.
void MicrophoneCapture::stopCaptureSession() {
  QV_LOG(logs::kCapture, "QVCaptureManager: stopDeviceCaptureSessionWithFinishHandler");
  const auto session = captureSession_.load();
  if (!session) return;
  session->setRunningObserver(nullptr);
  session->stopRunning();
  // Its last samples are queued by now.
  manager_.sessionSampleBufferQueue().sync([] {});
}

void MicrophoneCapture::stopMicrophoneCapture() {
  manager_.audioDispatchQueue().sync([this] {
    const auto session = captureSession_.load();
    if (!session) return;
    QV_LOG(logs::kCapture, "QVCaptureManager: setAudioCaptureEnabled: NO");
    // Its start was under way when the end came.
    if (session->isRunning()) session->stopRunning();
    session->removeInput(captureDeviceAudioInput_);
    session->removeOutput(captureSessionAudioDataOutput_);
  });
}

void MicrophoneCapture::captureOutputDidOutputSampleBuffer(const platform::CaptureOutput&,
                                                           const SampleBufferRef& sample) {
  if (!microphoneOutputHandler_) return;
  checkAndHandleMicInterruption();
  lastMicAudioDate_ = Date{platform_.clock->now().secondsSince1970 + sample->duration().seconds()};
  micInterruptionPresentationTimeStamp_ = sample->presentationTime() + sample->duration();
  microphoneOutputHandler_(sample);
}

void MicrophoneCapture::checkAndHandleMicInterruption() {
  if (!micInterrupted_->exchange(false)) return;
  if (!lastMicAudioDate_) return;
  const double gap = platform_.clock->now().secondsSince1970 - lastMicAudioDate_->secondsSince1970;
  if (!(gap > 0.0)) return;
  QV_LOG(logs::kCapture, "gap since last mic tap, filling with empty sample buffer");
  microphoneOutputHandler_(manager_.createEmptyAudioSampleBuffer(micInterruptionPresentationTimeStamp_, gap));
}

}  // namespace qv
