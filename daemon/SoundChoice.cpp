#include "daemon/SoundChoice.h"

#include "platform/threads/Log.h"

namespace qv {

using platform::AudioSessionCategory;
namespace logs = platform::logs;

/// What is set once, before it is known which sound there will be, goes to both.
class SoundChoice::BothAudioSessions final : public platform::AudioSession {
 public:
  explicit BothAudioSessions(platform::AudioSession& headless) : sessions_{&headless, nullptr} {}

  int32_t setCategory(AudioSessionCategory category, uint32_t options) override {
    std::lock_guard lock(mutex_);
    category_ = category;
    options_ = options;
    int32_t status = 0;
    for (platform::AudioSession* session : sessions_) {
      if (session != nullptr) status = session->setCategory(category, options);
    }
    return status;
  }
  void setInterruptionObserver(std::function<void(uint32_t)> observer) override {
    std::lock_guard lock(mutex_);
    observer_ = observer;
    for (platform::AudioSession* session : sessions_) {
      if (session != nullptr) session->setInterruptionObserver(observer);
    }
  }
  void add(platform::AudioSession& session) {
    std::lock_guard lock(mutex_);
    sessions_[1] = &session;
    if (category_) (void)session.setCategory(*category_, options_);
    if (observer_) session.setInterruptionObserver(observer_);
  }

 private:
  std::mutex mutex_;
  platform::AudioSession* sessions_[2];
  std::optional<AudioSessionCategory> category_;
  uint32_t options_ = 0;
  std::function<void(uint32_t)> observer_;
};

SoundChoice::SoundChoice(platform::HeadlessPlatform& headless)
    : headless_(headless), audioSession_(std::make_unique<BothAudioSessions>(headless.deviceCapture().audioSession())) {
  look();
  if (pulse() == nullptr) QV_LOG(logs::kPlatform, "app audio, microphone and sounds: headless");
}

SoundChoice::~SoundChoice() = default;

platform::AudioSession& SoundChoice::audioSession() { return *audioSession_; }

void SoundChoice::look() {
  std::lock_guard lock(mutex_);
  if (pulse_) return;
  auto connected = platform::PulsePlatform::connect();
  if (!connected) return;
  pulse_ = std::move(*connected);
  audioSession_->add(pulse_->deviceCapture().audioSession());
  QV_LOG(logs::kPlatform, "app audio, microphone and sounds: PulseAudio");
}

platform::PulsePlatform* SoundChoice::pulse() {
  std::lock_guard lock(mutex_);
  return pulse_.get();
}

platform::DeviceCaptureService& SoundChoice::deviceCapture() {
  platform::PulsePlatform* const server = pulse();
  return server != nullptr ? server->deviceCapture() : headless_.deviceCapture();
}

platform::ServiceState SoundChoice::state() {
  look();
  const char* const backend = pulse() != nullptr ? "PulseAudio" : "headless";
  const auto answer = platform::PulsePlatform::connect();
  return {backend, answer ? std::nullopt : std::optional(answer.error())};
}

int32_t SoundChoice::createInputQueue(const platform::AudioStreamDescription& format,
                                      platform::AppAudioInputCallback callback, uint32_t flags,
                                      std::unique_ptr<platform::AppAudioTapQueue>& queue) {
  look();
  platform::PulsePlatform* const server = pulse();
  auto& service = server != nullptr ? server->appAudioTap() : headless_.appAudioTap();
  return service.createInputQueue(format, std::move(callback), flags, queue);
}

std::shared_ptr<platform::DeviceCaptureSession> SoundChoice::createSession() {
  look();
  return deviceCapture().createSession();
}

std::shared_ptr<platform::CaptureDeviceInput> SoundChoice::createDefaultAudioInput() {
  return deviceCapture().createDefaultAudioInput();
}

std::shared_ptr<platform::AudioDataOutput> SoundChoice::createAudioDataOutput() {
  return deviceCapture().createAudioDataOutput();
}

void SoundChoice::play(uint32_t soundID) {
  platform::PulsePlatform* const server = pulse();
  (server != nullptr ? server->sounds() : headless_.sounds()).play(soundID);
}

}  // namespace qv
