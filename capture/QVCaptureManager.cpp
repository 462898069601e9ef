#include "capture/QVCaptureManager.h"

#include <utility>

#include "capture/AppAudioCapture.h"
#include "platform/threads/Log.h"

namespace qv {

using platform::AudioStreamDescription;
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

}  // namespace

QVCaptureManager::QVCaptureManager(platform::Platform& platform)
    : platform_(platform),
      audioBasicDescription_(kBasicDescription),
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
  setCaptureSessionVideoDataOutput(nullptr);
}

bool QVCaptureManager::hasAudioCaptureDevice() const { return platform_.deviceInfo->hasAudioCaptureDevice(); }

bool QVCaptureManager::hasVideoCaptureDevice() const { return captureSessionVideoDataOutput_.load() != nullptr; }

std::unique_ptr<AppAudioLease> QVCaptureManager::leaseAppAudio(OutputHandler outputHandler) {
  return std::make_unique<AppAudioCapture>(platform_, *this, std::move(outputHandler));
}

std::unique_ptr<MicrophoneLease> QVCaptureManager::startMicrophoneCaptureWithOutput(OutputHandler outputHandler,
                                                                                    DidStartHandler didStartHandler) {
  auto micInterrupted = std::make_shared<MicInterrupted>(false);
  microphones_.with([&](auto& microphones) {
    std::erase_if(microphones, [](const auto& microphone) { return microphone.expired(); });
    microphones.push_back(micInterrupted);
  });
  return std::make_unique<MicrophoneCapture>(platform_, *this, std::move(micInterrupted), std::move(outputHandler),
                                             std::move(didStartHandler));
}

void QVCaptureManager::handleAudioSessionInterruption(uint32_t type) {
  if (type == static_cast<uint32_t>(platform::AudioSessionInterruption::Began)) {
    QV_LOG(logs::kCapture, "QVCaptureManager: audio session interruption began");
    microphones_.with([](auto& microphones) {
      for (const auto& weak : microphones) {
        if (const auto micInterrupted = weak.lock()) *micInterrupted = true;
      }
    });
  } else if (type == static_cast<uint32_t>(platform::AudioSessionInterruption::Ended)) {
    QV_LOG(logs::kCapture, "QVCaptureManager: audio session interruption ended");
  }
}

void QVCaptureManager::setCaptureSessionVideoDataOutput(std::shared_ptr<platform::VideoDataOutput> output) {
  const auto former = captureSessionVideoDataOutput_.exchange(output);
  if (former && former != output) former->setSampleDelegate(nullptr, nullptr);
  if (output) output->setSampleDelegate(this, &sessionSampleBufferQueue_);
}

void QVCaptureManager::captureOutputDidOutputSampleBuffer(const platform::CaptureOutput& output,
                                                          const platform::SampleBufferRef& sample) {
  if (&output != captureSessionVideoDataOutput_.load().get()) return;
  if (const OutputHandler handler = cameraOutputHandler_.load()) handler(sample);
}

}  // namespace qv
