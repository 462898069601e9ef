#include <set>

#include "tests/daemon/DaemonTest.h"
#include "tests/ffmpeg/MovieProbe.h"
#include "tests/ffmpeg/SyntheticMedia.h"
#include "tests/kit/ScratchFolder.h"
#include "tests/movies/PatientMovies.h"

namespace qv {
namespace {

using platform::Value;

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
constexpr double kLargestOffset = 0.020;  // seconds between a picture and its beep

/// Numbered pictures, and a beep with each second, given to the daemon step by step on the time of the test.
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

  void sendSound(int64_t time) {
    const auto sound = platform::test::beepingSound(static_cast<double>(time) * 1e-9, kSoundFrames, {44100, 1, true});
    const auto bytes = sound->data()->bytes();
    ASSERT_TRUE(
        fakes::FakeAppAudioTap::fill(*device_.tap.tap, {bytes.begin(), bytes.end()}, static_cast<uint64_t>(time)));
    device_.deviceCapture.send(sound);
    device_.run();
  }
  void sendPicture() {
    const auto image = platform::test::numberedPicture(number_++, kWidth, kHeight);
    device_.screen.last().send(platform::SampleBuffer::makeVideo(
        image, platform::MediaTime::make(now_, platform::kHostTimescale), platform::MediaTime::invalid()));
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

  std::vector<double> beepsOf(int track) const {
    return platform::test::beeps(platform::test::decodeSound(path_, track, 8000), 8000);
  }
  /// The beeps are at the pictures whose second they began with.
  static void checkBeeps(const std::vector<platform::test::DecodedPicture>& shown, const std::set<uint32_t>& expected,
                         const std::vector<double>& beeps, const char* track) {
    ASSERT_EQ(beeps.size(), expected.size()) << track;
    auto beep = beeps.begin();
    for (const auto& picture : shown) {
      if (!expected.contains(picture.number)) continue;
      ASSERT_NEAR(*beep++, picture.time, kLargestOffset) << track << ", picture " << picture.number;
    }
    EXPECT_EQ(beep, beeps.end());
  }

  kit::ScratchFolder scratch_;
  const std::string path_ = scratch_ / "movie.mp4";
  platform::test::PatientMovies movies_{path_};
  TestClient client_;
  int64_t now_ = 5000 * kSecond + 3 * kStep;
  uint32_t number_ = 0;
  bool isMuted_ = false;
  std::vector<uint32_t> kept_;
  std::set<uint32_t> applicationBeeps_, microphoneBeeps_;  ///< by the number of the picture of that time
};

/// An hour with twenty pauses, another tapped process and a muted microphone: every picture once, in order and at its
/// time, and every beep at its picture, at the end as at the start.
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

  const auto movie = platform::test::probeGood(path_);
  ASSERT_EQ(movie.tracks.size(), 3u);
  EXPECT_NEAR(movie.duration, static_cast<double>(kept_.size()) / 10, 0.2);
  const auto shown = platform::test::decodePictures(path_);
  ASSERT_EQ(shown.size(), kept_.size());
  for (size_t i = 0; i < shown.size(); ++i) {
    ASSERT_EQ(shown[i].number, kept_[i]) << i;
    ASSERT_NEAR(shown[i].time, static_cast<double>(i) / 10, 1e-4) << i;
  }
  checkBeeps(shown, applicationBeeps_, beepsOf(0), "application");
  checkBeeps(shown, microphoneBeeps_, beepsOf(1), "microphone");
  EXPECT_GT(applicationBeeps_.size(), microphoneBeeps_.size());
}

}  // namespace
}  // namespace qv
