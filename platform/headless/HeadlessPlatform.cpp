#include "platform/headless/HeadlessPlatform.h"

#include "platform/headless/TestSignal.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// Beeps on all channels.
///
/// Threading: immutable.
class BeepSource final : public PCMSource {
 public:
  BeepSource(const PCMFormat& format, double frequency) : format_(format), frequency_(frequency) {}
  std::chrono::nanoseconds latency() const override { return {}; }
  void render(uint64_t hostTime, std::span<int16_t> samples) override {
    for (size_t i = 0; i < samples.size(); ++i) {
      const uint64_t frame = i / format_.channels;
      samples[i] = testsignal::beepSample(hostTime + frame * 1'000'000'000 / format_.sampleRate, frequency_);
    }
  }

 private:
  const PCMFormat format_;
  const double frequency_;
};

std::unique_ptr<PCMSource> openApplicationAudio(pid_t /*process*/, const PCMFormat& format) {
  return std::make_unique<BeepSource>(format, testsignal::kAppBeepFrequency);
}

MicrophoneSource microphone(bool isPresent) {
  return {.isAvailable = [isPresent] { return isPresent; },
          .open = [](const PCMFormat& format) -> std::unique_ptr<PCMSource> {
            return std::make_unique<BeepSource>(format, testsignal::kMicrophoneBeepFrequency);
          }};
}

/// Threading: thread-safe.
class LoggedSounds final : public SystemSounds {
 public:
  void play(uint32_t soundID) override { QV_LOG_INFO(logs::kAudio, "headless sound %u", soundID); }
};

}  // namespace

HeadlessPlatform::HeadlessPlatform(HeadlessOptions options)
    : screen_(*options.clock),
      deviceCapture_(microphone(options.hasMicrophone), *options.clock),
      appAudioTap_(openApplicationAudio, *options.clock),
      applications_(std::move(options.processOfBundleIdentifier), std::move(options.frontmostApplication)),
      alerts_(std::move(options.alertPolicy)),
      sounds_(std::make_unique<LoggedSounds>()) {}

HeadlessPlatform::~HeadlessPlatform() = default;

}  // namespace qv::platform
