#include "capture/QVCaptureManager.h"

#include "platform/Log.h"

namespace qv {

using platform::AudioStreamDescription;
using platform::MediaTime;
namespace logs = platform::logs;

namespace {

/// 16-bit signed big-endian mono at 44.1 kHz.
constexpr AudioStreamDescription kBasicDescription{44100.0,
                                                   platform::kAudioFormatLinearPCM,
                                                   platform::kAudioFormatFlagIsBigEndian |
                                                       platform::kAudioFormatFlagIsSignedInteger |
                                                       platform::kAudioFormatFlagIsPacked,
                                                   2,
                                                   1,
                                                   2,
                                                   1,
                                                   16,
                                                   0};

constexpr platform::AudioTimeStamp kInitialTimestamp{0.0, 0, 1.0, 0, {}, 0, 0};

}  // namespace

QVCaptureManager& QVCaptureManager::sharedManager() {
  static QVCaptureManager* const manager = new QVCaptureManager(platform::Platform::current());
  return *manager;
}

QVCaptureManager::QVCaptureManager(platform::Platform& platform)
    : platform_(platform),
      audioBasicDescription_(kBasicDescription),
      initialTimestamp_(kInitialTimestamp),
      audioDispatchQueue_("com.tarnwick.Quorvel.CaptureQueue", *platform.globalQueue),
      sessionSampleBufferQueue_("com.tarnwick.quorvel.capture.session", *platform.globalQueue) {
  platform::AudioSession& audioSession = platform_.deviceCapture->audioSession();
  audioSession.setInterruptionObserver([this](uint32_t type) { handleAudioSessionInterruption(type); });
  // A device that refuses the category still records what it can.
  (void)audioSession.setCategory(platform::AudioSessionCategory::PlayAndRecord,
                                 platform::kAudioSessionMixWithOthers | platform::kAudioSessionAllowBluetooth);
}

QVCaptureManager::~QVCaptureManager() {
  platform_.deviceCapture->audioSession().setInterruptionObserver(nullptr);
  stopAllCapture();
}

bool QVCaptureManager::hasAudioCaptureDevice() const { return platform_.deviceInfo->hasAudioCaptureDevice(); }

void QVCaptureManager::startCaptureSession() {
  QV_LOG(logs::kCapture, "QVCaptureManager: startCaptureSession");
  if (sessionInProgress_.exchange(true)) return;
  setCaptureSession(platform_.deviceCapture->createSession());
}

void QVCaptureManager::setCaptureSession(std::shared_ptr<platform::DeviceCaptureSession> session) {
  const auto former = captureSession_.load();
  if (session == former) return;
  if (former) former->setRunningObserver(nullptr);
  captureSession_.store(std::move(session));
}

void QVCaptureManager::stopCaptureSession() {
  QV_LOG(logs::kCapture, "QVCaptureManager: stopDeviceCaptureSessionWithFinishHandler");
  if (!sessionInProgress_.exchange(false)) return;
  const auto session = captureSession_.load();
  if (!session) return;
  session->setRunningObserver(nullptr);
  session->stopRunning();
  // Its last samples are queued by now.
  sessionSampleBufferQueue_.sync([] {});
}

void QVCaptureManager::stopAllCapture() {
  // The tap's end is waited for together with the microphone's.
  audioDispatchQueue_.async([this] { stopTap(); });
  stopCaptureSession();
  stopMicrophoneCapture();
  stopAppAudioCapture();
  cameraOutputHandler_.store(nullptr);
  microphoneOutputHandler_.store(nullptr);
  appAudioOutputHandler_.store(nullptr);
  captureStartTime_.store(MediaTime::invalid());
  lastAudioDate_.store(std::nullopt);
  lastMicAudioDate_.store(std::nullopt);
}

}  // namespace qv
