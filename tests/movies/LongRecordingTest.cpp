#include <cmath>
#include <cstring>
#include <set>
#include <thread>

#include "platform/headless/TestPattern.h"
#include "platform/headless/TestSignal.h"
#include "tests/daemon/DaemonTest.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/movies/PatientMovies.h"

namespace qv {
namespace {

using platform::Value;
namespace testsignal = platform::testsignal;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int64_t kSegmentSteps = 202;  // seven minutes in all
#else
constexpr int64_t kSegmentSteps = 1722;  // an hour in all
#endif
constexpr int kPauses = 20;
constexpr int64_t kStep = kSecond / 10;  // from picture to picture
constexpr int64_t kAllSound = 600;       // steps
constexpr int64_t kSoundFrames = 4410;   // of a step
constexpr uint32_t kWidth = 160, kHeight = 90;
constexpr double kLargestOffset = 0.020;  // seconds between a flash and its beep

/// The headless device's pictures and sounds, given to the daemon step by step on the time of the test.
class LongRecordingTest : public DaemonTest {
 protected:
  LongRecordingTest() : client_(game()) {
    suppressAlert();
    platform::setLogLevel(platform::LogLevel::Error);
    device_.platform.assetWriter = &movies_;
    device_.deviceInfo.audioCaptureDevice = true;
    device_.applications.owners[5] = 100;
    device_.clock.setHostTime(platform::MediaTime::make(now_, platform::kHostTimescale));
  }

  static std::vector<uint8_t> soundAt(int64_t time, double frequency) {
    std::vector<uint8_t> bytes;
    for (int64_t i = 0; i < kSoundFrames; ++i) {
      const auto at = static_cast<uint64_t>(time + i * kSecond / 44100);
      const auto value = static_cast<uint16_t>(testsignal::beepSample(at, frequency));
      bytes.push_back(static_cast<uint8_t>(value >> 8));
      bytes.push_back(static_cast<uint8_t>(value));
    }
    return bytes;
  }
  void sendSound(int64_t time) {
    const auto application = soundAt(time, testsignal::kAppBeepFrequency);
    ASSERT_TRUE(fakes::FakeAppAudioTap::fill(*device_.tap.tap, application, static_cast<uint64_t>(time)));
    device_.deviceCapture.send(platform::SampleBuffer::makeAudio(
        std::make_shared<platform::DataBlock>(soundAt(time, testsignal::kMicrophoneBeepFrequency)),
        captureManager_.createAudioFormatDescription(), kSoundFrames,
        platform::MediaTime::make(time, platform::kHostTimescale)));
    device_.run();
  }
  void sendPicture() {
    std::shared_ptr<platform::SharedFrame> frame;
    while (!frame) {  // all are with the encoder
      frame = pattern_.paint({kWidth, kHeight, kWidth * 4}, number_, static_cast<uint64_t>(now_));
      if (!frame) std::this_thread::yield();
    }
    ++number_;
    device_.screen.last().send(platform::SampleBuffer::makeVideo(
        std::make_shared<platform::PixelBuffer>(frame), platform::MediaTime::make(now_, platform::kHostTimescale),
        platform::MediaTime::invalid()));
    device_.run();
  }
  /// Lets one stretch between two pauses pass. Far from both ends only every seventh second has sound, to spare the
  /// encoder.
  void record(int segment) {
    for (int64_t step = 0; step <= kSegmentSteps; ++step) {
      const bool hasAllSound =
          (segment == 0 && step < kAllSound) || (segment == kPauses && step > kSegmentSteps - kAllSound);
      if (step > 0 && (hasAllSound || (now_ - kStep) / kSecond % 7 == 0)) {
        sendSound(now_ - kStep);
        for (auto* beeps : {&applicationBeeps_, isMuted_ ? nullptr : &microphoneBeeps_}) {
          if (beeps && (now_ - kStep) % kSecond == 0) beeps->insert(number_ - 1);
        }
      }
      // What a resume brings first has the time of what was last before it, and is left out.
      if (segment == 0 || step > 0) kept_.push_back(number_);
      sendPicture();
      if (segment == 0 && step == kSegmentSteps / 3) switchTap();
      if (segment == 0 && step % (kSegmentSteps / 2) == kSegmentSteps / 4) mute(!isMuted_);
      advance(kStep);
    }
    now_ -= kStep;
    device_.clock.setHostTime(platform::MediaTime::make(now_, platform::kHostTimescale));
  }
  void advance(int64_t nanoseconds) {
    now_ += nanoseconds;
    device_.clock.advance(std::chrono::nanoseconds(nanoseconds));
  }
  void switchTap() { client_.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{100})}); }
  void mute(bool muted) {
    isMuted_ = muted;
    client_.request("setMicrophoneEnabled", {Value(!muted)});
  }
  void pauseFor(int64_t nanoseconds) {
    client_.request("pauseRecording");
    advance(nanoseconds);
    client_.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{5})});
  }

  struct Shown {
    double time;
    uint32_t number;
    bool isFlash;
  };
  /// Each cell of the test picture's grid becomes one pixel.
  std::vector<Shown> decode() const {
    const std::string pixels =
        platform::test::run("ffmpeg -v error -nostdin -i '" + path_ +
                            "' -map 0:v:0 -fps_mode passthrough -vf scale=16:9:flags=area -f rawvideo -pix_fmt gray -");
    const auto packets = platform::test::packetsOfPictures(path_);
    constexpr size_t kSize = 16 * 9;
    EXPECT_EQ(pixels.size(), packets.size() * kSize);
    std::vector<Shown> shown;
    for (size_t i = 0; i < packets.size() && (i + 1) * kSize <= pixels.size(); ++i) {
      const testsignal::Picture picture{{reinterpret_cast<const uint8_t*>(pixels.data()) + i * kSize, kSize},
                                        16,
                                        9,
                                        16,
                                        testsignal::Picture::Format::Luma8};
      shown.push_back({packets[i].time, testsignal::decodeFrameNumber(picture).value_or(UINT32_MAX),
                       testsignal::decodeFlash(picture)});
    }
    return shown;
  }
  std::vector<double> beepStarts(int track) const {
    constexpr double kRate = 8000;
    const std::string raw = platform::test::run("ffmpeg -v error -nostdin -i '" + path_ +
                                                "' -map 0:a:" + std::to_string(track) + " -ac 1 -ar 8000 -f s16le -");
    std::vector<double> starts;
    double loudUntil = -1;
    for (size_t i = 0; i < raw.size() / 2; ++i) {
      int16_t sample = 0;
      std::memcpy(&sample, raw.data() + 2 * i, sizeof sample);
      if (std::abs(sample) < 4000) continue;
      const double time = static_cast<double>(i) / kRate;
      if (time - loudUntil > 0.3) starts.push_back(time);
      loudUntil = time;
    }
    return starts;
  }
  /// The flashes, of which `expected` have a beep, and the beeps are the same events.
  static void checkBeeps(const std::vector<Shown>& shown, const std::set<uint32_t>& expected,
                         const std::vector<double>& beeps, const char* track) {
    ASSERT_EQ(beeps.size(), expected.size()) << track;
    auto beep = beeps.begin();
    for (const Shown& picture : shown) {
      if (!expected.contains(picture.number)) continue;
      EXPECT_TRUE(picture.isFlash) << picture.number;
      ASSERT_NEAR(*beep++, picture.time, kLargestOffset) << track << ", picture " << picture.number;
    }
    EXPECT_EQ(beep, beeps.end());
  }

  platform::test::ScratchDirectory scratch_;
  const std::string path_ = scratch_ / "movie.mp4";
  platform::test::PatientMovies movies_{path_};
  TestClient client_;
  platform::TestPattern pattern_;
  int64_t now_ = 5000 * kSecond + 3 * kStep;
  uint32_t number_ = 0;
  bool isMuted_ = false;
  std::vector<uint32_t> kept_;
  std::set<uint32_t> applicationBeeps_, microphoneBeeps_;  ///< by the number of the flash's first picture
};

/// An hour with twenty pauses, another tapped process and a muted microphone: every picture once, in order and at its
/// time, and every beep at its flash, at the end as at the start.
TEST_F(LongRecordingTest, StaysInSyncForAnHourAndTwentyPauses) {
  client_.start({.contexts = {5}, .width = kWidth, .height = kHeight, .microphone = true});
  for (int segment = 0; segment <= kPauses; ++segment) {
    if (segment > 0) pauseFor((segment * 7 % 40) * kSecond + 8 * kStep);
    record(segment);
    ASSERT_TRUE(client_.isRecording());
  }
  client_.send("stopRecordingWithHandler");
  movies_.waitForFinish();
  device_.run();
  ASSERT_TRUE(client_.answer().has_value());

  const auto movie = platform::test::probe(path_);
  EXPECT_EQ(movie.errors, "");
  ASSERT_EQ(movie.tracks.size(), 3u);
  EXPECT_NEAR(movie.duration, static_cast<double>(kept_.size()) / 10, 0.2);
  const auto shown = decode();
  ASSERT_EQ(shown.size(), kept_.size());
  for (size_t i = 0; i < shown.size(); ++i) {
    ASSERT_EQ(shown[i].number, kept_[i]) << i;
    ASSERT_NEAR(shown[i].time, static_cast<double>(i) / 10, 1e-4) << i;
  }
  checkBeeps(shown, applicationBeeps_, beepStarts(0), "application");
  checkBeeps(shown, microphoneBeeps_, beepStarts(1), "microphone");
  EXPECT_GT(applicationBeeps_.size(), microphoneBeeps_.size());
}

}  // namespace
}  // namespace qv
