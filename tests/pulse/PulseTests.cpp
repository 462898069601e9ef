#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <initializer_list>
#include <vector>

#include "platform/pulse/PulsePlatform.h"
#include "platform/threads/Clock.h"
#include "tests/pulse/PulseFixture.h"

namespace qv::platform {
namespace {

constexpr double kAmplitude = 8000;  // of a player's tone
constexpr double kTolerance = 200;   // of an amplitude
constexpr size_t kTenth = 4410;

/// 0.3 s in which each of the tones has its amplitude. A machine that is held up makes gaps, so ten are tried; where
/// all fail, the last.
std::vector<int16_t> nextSteady(Capture& capture, std::initializer_list<double> tones) {
  std::vector<int16_t> samples;
  const auto isWhole = [&](double tone) { return std::abs(amplitudeOf(tone, samples) - kAmplitude) < kTolerance; };
  for (int attempt = 0; attempt < 10; ++attempt) {
    samples = capture.next(3 * kTenth);
    if (std::all_of(tones.begin(), tones.end(), isWhole)) break;
  }
  return samples;
}

class Microphone final : public CaptureOutputDelegate {
 public:
  explicit Microphone(DeviceCaptureService& service)
      : session_(service.createSession()),
        input_(service.createDefaultAudioInput()),
        output_(service.createAudioDataOutput()) {
    output_->setSampleDelegate(this, &queue_);
    if (session_->canAddInput(input_)) session_->addInput(input_);
    session_->addOutput(output_);
    session_->startRunning();
  }
  ~Microphone() override { session_->removeOutput(output_); }
  void start() { session_->startRunning(); }
  void stop() {
    session_->stopRunning();
    queue_.sync([] {});
  }
  void captureOutputDidOutputSampleBuffer(const CaptureOutput&, const SampleBufferRef& sample) override {
    capture.add(static_cast<uint64_t>(sample->presentationTime().value), sample->data()->bytes().data(),
                static_cast<size_t>(sample->numSamples()));
  }
  [[nodiscard]] bool hasInput() const { return input_ != nullptr; }
  Capture capture;

 private:
  SerialQueue queue_{"microphone"};
  const std::shared_ptr<DeviceCaptureSession> session_;
  const std::shared_ptr<CaptureDeviceInput> input_;
  const std::shared_ptr<AudioDataOutput> output_;
};

class PulseTapTest : public PulseTest {
 protected:
  void SetUp() override {
    PulseTest::SetUp();
    if (IsSkipped() || HasFatalFailure()) return;
    auto platform = PulsePlatform::connect(server());
    ASSERT_TRUE(platform);
    platform_ = std::move(platform.value());
  }
  Capture capture_;
  std::unique_ptr<PulsePlatform> platform_;
};

TEST_F(PulseTapTest, HearsOneProcessAloneAndSilenceWhileItPlaysNothing) {
  TonePlayer first(server()), second(server());
  ASSERT_EQ(first.tell("open appout 440"), "opened");
  ASSERT_EQ(second.tell("open appout 1000"), "opened");
  ASSERT_GT(second.sound(), 0u);
  const auto queue = tap(platform_->appAudioTap(), first.pid(), capture_);
  for (const int16_t sample : capture_.next(3 * kTenth)) ASSERT_EQ(sample, 0);
  ASSERT_GT(first.sound(), 0u);
  ASSERT_TRUE(capture_.waitForTone(440));
  const auto samples = nextSteady(capture_, {440});
  EXPECT_NEAR(amplitudeOf(440, samples), kAmplitude, kTolerance);
  EXPECT_LT(amplitudeOf(1000, samples), 10);
  EXPECT_TRUE(capture_.isContinuous());
}

TEST_F(PulseTapTest, PlacesALateStreamOnTheHostClock) {
  TonePlayer player(server());
  const auto queue = tap(platform_->appAudioTap(), player.pid(), capture_);
  capture_.next(kTenth);
  ASSERT_EQ(player.tell("open appout 440"), "opened");
  const uint64_t onset = player.sound();
  ASSERT_TRUE(capture_.waitForTone(440));
  EXPECT_NEAR(static_cast<double>(capture_.firstSound()) * 1e-6, static_cast<double>(onset) * 1e-6, 25)
      << "milliseconds";
  EXPECT_TRUE(capture_.isContinuous());
}

TEST_F(PulseTapTest, SumsTheStreamsOfAProcessAndItsChildren) {
  TonePlayer parent(server(), true);
  ASSERT_EQ(parent.tell("open appout 440 1500"), "opened");
  ASSERT_GT(parent.sound(), 0u);
  const auto queue = tap(platform_->appAudioTap(), parent.pid(), capture_);
  ASSERT_TRUE(capture_.waitForTone(440));
  ASSERT_TRUE(capture_.waitForTone(1500));
  const auto samples = nextSteady(capture_, {440, 1500});
  EXPECT_NEAR(amplitudeOf(440, samples), kAmplitude, kTolerance);
  EXPECT_NEAR(amplitudeOf(1500, samples), kAmplitude, kTolerance);
}

TEST_F(PulseTapTest, FollowsAStreamToAnotherOutput) {
  TonePlayer player(server());
  ASSERT_EQ(player.tell("open appout 440"), "opened");
  ASSERT_GT(player.sound(), 0u);
  const auto queue = tap(platform_->appAudioTap(), player.pid(), capture_);
  ASSERT_TRUE(capture_.waitForTone(440));
  ASSERT_EQ(player.tell("move other"), "moved");
  capture_.next(3 * kTenth);  // sound of before the move is still on its way
  EXPECT_TRUE(capture_.waitForTone(440));
  EXPECT_TRUE(capture_.isContinuous());
}

TEST_F(PulseTapTest, GoesOnWithoutTheServerAndFindsItAgain) {
  Microphone microphone(platform_->deviceCapture());
  ASSERT_TRUE(microphone.hasInput());
  const auto queue = tap(platform_->appAudioTap(), ::getpid(), capture_);
  {
    TonePlayer player(server());  // a child of this process
    ASSERT_EQ(player.tell("open appout 440"), "opened");
    ASSERT_GT(player.sound(), 0u);
    ASSERT_TRUE(capture_.waitForTone(440));
    killServer();
    capture_.next(3 * kTenth);
    for (const int16_t sample : capture_.next(3 * kTenth)) ASSERT_EQ(sample, 0);
  }
  startServer();
  TonePlayer player(server());
  ASSERT_EQ(player.tell("open micsrc 440"), "opened");
  ASSERT_GT(player.sound(), 0u);
  EXPECT_TRUE(capture_.waitForTone(440));
  EXPECT_TRUE(microphone.capture.waitForTone(440));
  EXPECT_TRUE(capture_.isContinuous());
  EXPECT_TRUE(microphone.capture.isContinuous());
}

TEST_F(PulseTapTest, MicrophoneHearsTheDefaultSourceOnTheHostClock) {
  TonePlayer player(server());
  ASSERT_EQ(player.tell("open micsrc 440"), "opened");
  Microphone microphone(platform_->deviceCapture());
  ASSERT_TRUE(microphone.hasInput());
  for (const int16_t sample : microphone.capture.next(3 * kTenth)) ASSERT_EQ(sample, 0);
  const uint64_t onset = player.sound();
  ASSERT_TRUE(microphone.capture.waitForTone(440));
  const auto samples = nextSteady(microphone.capture, {440});
  EXPECT_NEAR(amplitudeOf(440, samples), kAmplitude, kTolerance);
  // A remapped source reports its own latency, not that of the output behind it.
  EXPECT_NEAR(static_cast<double>(microphone.capture.firstSound()) * 1e-6, static_cast<double>(onset) * 1e-6, 80)
      << "milliseconds";
}

/// Sound is handed on 120 ms late only while it goes on.
TEST_F(PulseTapTest, AStopHandsOverWhatWasPlayedAndHeardUpToIt) {
  TonePlayer player(server()), speaker(server());
  ASSERT_EQ(player.tell("open appout 440"), "opened");
  ASSERT_EQ(speaker.tell("open micsrc 440"), "opened");
  ASSERT_GT(player.sound(), 0u);
  ASSERT_GT(speaker.sound(), 0u);
  const auto queue = tap(platform_->appAudioTap(), player.pid(), capture_);
  Microphone microphone(platform_->deviceCapture());
  // All up to the stop is there, but for a frame; and whether the time that is handed on only at a stop has its tone.
  const auto isWhole = [](Capture& capture, uint64_t stop) {
    EXPECT_GE(capture.end() + 50'000, stop);
    auto samples = capture.from(stop - 110'000'000);
    samples.resize(kTenth / 2);
    return std::count_if(samples.begin(), samples.end(), [](int16_t s) { return std::abs(s) > 800; }) >
           static_cast<ptrdiff_t>(kTenth / 4);
  };
  // A server that the machine holds up just then delivers late.
  bool isTapWhole = false, isMicrophoneWhole = false;
  for (int round = 0; round < 10 && !(isTapWhole && isMicrophoneWhole); ++round) {
    ASSERT_TRUE(capture_.waitForTone(440));
    ASSERT_TRUE(microphone.capture.waitForTone(440));
    uint64_t stop = static_cast<uint64_t>(systemClock().hostTime().value);
    ASSERT_EQ(queue->stop(), 0);
    isTapWhole |= isWhole(capture_, stop);
    stop = static_cast<uint64_t>(systemClock().hostTime().value);
    microphone.stop();
    isMicrophoneWhole |= isWhole(microphone.capture, stop);
    ASSERT_EQ(queue->start(), 0);
    microphone.start();
  }
  EXPECT_TRUE(isTapWhole);
  EXPECT_TRUE(isMicrophoneWhole);
}

TEST_F(PulseTapTest, PlaysTheSystemSounds) {
  const auto queue = tap(platform_->appAudioTap(), ::getpid(), capture_);
  platform_->sounds().play(1117);
  double low = 0;
  for (int tenth = 0; tenth < 100 && low < 500; ++tenth) low = amplitudeOf(880, capture_.next(kTenth));
  EXPECT_GE(low, 500);
}

TEST(PulsePlatform, FailsWhereNoServerAnswers) {
  const auto platform = PulsePlatform::connect("unix:/nonexistent/socket");
  ASSERT_FALSE(platform);
  EXPECT_EQ(platform.error().domain, kPosixErrorDomain);
}

}  // namespace
}  // namespace qv::platform
