#include <cerrno>
#include <cstring>
#include <tuple>

#include "session/PictureTransform.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::AffineTransform;
using platform::Value;

class PipelineTest : public DaemonTest {
 protected:
  PipelineTest() : client_(game()) {
    suppressAlert();
    device_.applications.owners[5] = 100;
  }
  void pause() { client_.request("pauseRecording"); }
  void resume() { client_.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{5})}); }
  /// In tenths of a second.
  void frame(int64_t tenths) { sendFrame(tenths * kSecond / 10); }
  std::vector<int64_t> writtenTenths() {
    auto times = device_.movies.video().times();
    for (int64_t& time : times) time /= kSecond / 10;
    return times;
  }
  TestClient client_;
};

TEST_F(PipelineTest, PausesLeaveNoGapInTheVideo) {
  constexpr int64_t kPause = 0;
  const std::pair<std::vector<int64_t>, std::vector<int64_t>> cases[] = {
      // The first frame after a pause takes the time of the last one before, which the writer has already.
      {{100, 101, kPause, 250, 251, 300, kPause, 400, 401}, {100, 101, 102, 151, 152}},
      {{100, 101, kPause, 250, kPause, 400, 401}, {100, 101, 102}},
      {{kPause, 100, 101}, {100, 101}}};
  for (const auto& [captured, written] : cases) {
    client_.start();
    for (const int64_t tenths : captured) {
      if (tenths == kPause) {
        pause();
        resume();
      } else {
        frame(tenths);
      }
    }
    EXPECT_EQ(writtenTenths(), written);
    EXPECT_EQ(device_.movies.video().samples.back()->captureTime().value, captured.back() * kSecond / 10);
    client_.stop();
  }
}

TEST_F(PipelineTest, AnEndedRecordingLeavesItsTimesBehind) {
  client_.start();
  frame(100);
  pause();
  resume();
  frame(200);
  auto& controller = device_.screen.last();
  controller.delegate.lock()->screenCaptureControllerWasPreempted(controller);
  device_.run();
  EXPECT_EQ(client_.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  client_.start();
  frame(300);
  EXPECT_EQ(writtenTenths(), std::vector<int64_t>{300});
}

TEST_F(PipelineTest, TransformOfAllFlagsOfWhichTheMovieHasNone) {
  const AffineTransform transforms[] = {{1, 0, 0, 1},  {1, 0, 0, -1}, {-1, 0, 0, 1},  {-1, 0, 0, -1},
                                        {0, 1, -1, 0}, {0, 1, 1, 0},  {0, -1, -1, 0}, {0, -1, 1, 0}};
  // Upright, mirrored at the horizontal, at the vertical, at both; turned to the left, and the same of that.
  const uint32_t orientations[] = {1, 4, 2, 3, 8, 5, 7, 6};
  for (uint64_t flags = 0; flags < 8; ++flags) {
    EXPECT_EQ(orientationFromVellTransform(flags), orientations[flags]) << flags;
    EXPECT_EQ(_affineTransformFromVellTransformFlags(flags), transforms[flags]) << flags;
  }
  for (const uint64_t unknown : {8, 9}) EXPECT_EQ(orientationFromVellTransform(unknown), 1u);
  client_.start();
  sendFrame(kSecond, 5);
  EXPECT_EQ(device_.movies.video().transform, AffineTransform::identity());
  EXPECT_EQ(device_.movies.video().settings.at(platform::settings::kVideoWidth).asDouble(), 1280);
  EXPECT_EQ(device_.screen.last().interval, platform::MediaTime::make(1, 60));
  EXPECT_EQ(device_.screen.last().size, (platform::Size{1280, 720}));
}

TEST_F(PipelineTest, AudioOfTheApplicationAndAMutedMicrophoneReachTheirTracks) {
  device_.deviceInfo.audioCaptureDevice = true;
  client_.start({.microphone = true});
  frame(10);
  ASSERT_TRUE(device_.tap.fill(100, 2 * kSecond));
  speak(2 * kSecond, 10);
  client_.request("setMicrophoneEnabled", {Value(false)});
  speak(3 * kSecond, 10);
  device_.run();
  EXPECT_EQ(device_.movies.appAudio().samples.size(), 1u);
  const auto& microphone = device_.movies.microphone().samples;
  ASSERT_EQ(microphone.size(), 2u);
  EXPECT_EQ(microphone[0]->data()->bytes()[0], 9);
  EXPECT_EQ(microphone[1]->data()->bytes()[0], 0);
  pause();
  resume();
  speak(4 * kSecond, 10);
  device_.run();
  EXPECT_EQ(microphone.size(), 2u) << "the pause lasts until the next picture";
}

/// A picture, a second, a pause of two; then what the case says, and a stop.
TEST_F(PipelineTest, AMovieEndsWhereItsRecordingWasStoppedOrPaused) {
  const auto picture = [this] { sendFrame(device_.clock.hostTime().value); };
  const auto wait = [this](double seconds) { device_.clock.advanceSeconds(seconds); };
  const std::pair<std::function<void()>, int> cases[] = {
      {[&] {}, 1},
      {[&] { pause(); }, 1},
      {[&] { resume(), wait(1); }, 1},  // no picture closed the pause
      {[&] { resume(), wait(1), pause(); }, 1},
      {[&] { resume(), picture(), wait(2); }, 2}};  // the picture takes the first one's time
  for (const auto& [goOn, seconds] : cases) {
    client_.start();
    const auto begin = device_.clock.hostTime();
    picture(), wait(1), pause(), wait(2);
    goOn();
    client_.stop();
    EXPECT_EQ(device_.movies.last().sessionEnd - begin, platform::MediaTime::make(seconds, 1));
  }
}

TEST_F(PipelineTest, AFileThatFailsEndsTheRecordingByItsCauseAndIsHandedOver) {
  const auto failWith = [this](const platform::Error& failure) {
    client_.start();
    frame(10);
    device_.movies.last().status = platform::AssetWriterStatus::Failed;
    device_.movies.last().error = failure;
  };
  const auto isInStore = [this] { return !contentAt(device_.movies.last().url.absoluteString()).empty(); };
  constexpr uint64_t kRoom = 1ull << 40;
  const std::tuple<platform::Error, uint64_t, int64_t> cases[] = {
      {platform::Error::posix(ENOSPC), kRoom, errorcode::kInsufficientStorage},
      {platform::Error::posix(EDQUOT), kRoom, errorcode::kInsufficientStorage},
      {platform::Error::posix(EIO), kRoom, errorcode::kFailedToSave},
      {{"another", ENOSPC, {}}, kRoom, errorcode::kFailedToSave},
      {platform::Error::posix(EIO), 0, errorcode::kInsufficientStorage}};
  for (const auto& [failure, freeSize, code] : cases) {
    device_.disk.setFreeSize(kRoom);
    failWith(failure);
    device_.disk.setFreeSize(freeSize);
    frame(11);
    EXPECT_EQ(client_.takeEnds(), std::vector<int64_t>{code}) << failure.description();
    EXPECT_EQ(client_.lastMovie(), device_.movies.last().url.absoluteString());
    EXPECT_EQ(device_.salvage.salvaged.back(), "Game.mp4");
    EXPECT_TRUE(isInStore());
  }
  device_.disk.setFreeSize(kRoom);
  failWith(platform::Error::posix(EIO));
  EXPECT_EQ(client_.stop()->code(1), errorcode::kFailedToSave);
  EXPECT_TRUE(isInStore());
}

/// A tap and a microphone hand over at their stop what was captured since their last buffer, here 100 ms that begin
/// 50 ms before now, and whatever they captured while they were being stopped.
TEST_F(PipelineTest, SoundOfBeforeAPauseOrAStopIsWrittenThoughItComesAfterwards) {
  device_.deviceInfo.audioCaptureDevice = true;
  client_.start({.microphone = true});
  const auto play = [&](int64_t time, uint32_t frames) { ASSERT_TRUE(device_.tap.fill(frames, time)); };
  const auto handOverAtStop = [&] {
    const int64_t now = device_.clock.hostTime().value;
    device_.tap.tap->atStop = [now, play] {
      play(now - kSecond / 20, 4410);
      play(now + kSecond / 20, 441);
    };
    device_.deviceCapture.session->atStop = [this, now] {
      speak(now - kSecond / 20, 4410);
      speak(now + kSecond / 20, 441);
    };
  };
  const auto framesWritten = [&](const auto& input) {
    std::vector<int64_t> frames;
    for (const auto& sample : input.samples) frames.push_back(sample->numSamples());
    return frames;
  };
  frame(device_.clock.hostTime().value / (kSecond / 10));
  handOverAtStop();
  pause();
  EXPECT_EQ(framesWritten(device_.movies.appAudio()), std::vector<int64_t>{2205});
  EXPECT_EQ(framesWritten(device_.movies.microphone()), std::vector<int64_t>{2205});

  device_.clock.advanceSeconds(2);
  resume();
  frame(device_.clock.hostTime().value / (kSecond / 10));
  handOverAtStop();
  client_.request("stopRecordingWithHandler");
  EXPECT_EQ(framesWritten(device_.movies.appAudio()), (std::vector<int64_t>{2205, 2205}));
  EXPECT_EQ(framesWritten(device_.movies.microphone()), (std::vector<int64_t>{2205, 2205}));
}

TEST_F(PipelineTest, CaptureHandsFramesAndAudioToTheClient) {
  device_.deviceInfo.audioCaptureDevice = true;
  client_.start({.microphone = true, .capture = true});
  speak(kSecond / 2, 10);
  device_.run();
  frame(10);
  ASSERT_TRUE(device_.tap.fill(100, 2 * kSecond));
  device_.run();
  EXPECT_EQ(client_.object().takeCall().member, "captureTimelineDidChange");
  EXPECT_EQ(client_.object().takeCall().arguments.at(3).asInteger(), 3) << "the microphone is heard first";
  const auto video = client_.object().takeCall();
  ASSERT_EQ(video.member, "captureHandlerWithSample");
  const auto frame = QVSharedFrameObject::decodeFromIPC(video.arguments[0]);
  ASSERT_TRUE(frame.sharedFrame());
  EXPECT_EQ(frame.sharedFrame()->layout().width, 4u);
  platform::SampleTimingInfo timing;
  ASSERT_EQ(video.arguments[1].asData().size(), sizeof timing);
  std::memcpy(&timing, video.arguments[1].asData().data(), sizeof timing);
  EXPECT_EQ(timing.presentationTimeStamp, platform::MediaTime::make(1, 1));
  const auto audio = client_.object().takeCall();
  ASSERT_EQ(audio.member, "captureHandlerWithAudioSample");
  EXPECT_EQ(audio.arguments[0].asData().size(), 200u);
  EXPECT_EQ(audio.arguments[1].asData().size(), 40u);
  EXPECT_EQ(audio.arguments[2].asInteger(), 100);
  EXPECT_EQ(audio.arguments[3].asInteger(), 2);
  EXPECT_TRUE(device_.movies.movies.empty()) << "a capture makes no file";
  // What a tap hands over when its client has gone is nobody's.
  device_.tap.tap->atStop = [this] { (void)device_.tap.fill(100, 3 * kSecond); };
  client_.disconnect();
  EXPECT_EQ(device_.metrics.messages.back().serviceName, "InAppCapture");
  EXPECT_EQ(valueForKey(device_.metrics.messages.back().payload, "RecordedFileSize").asInteger(), 0);
  EXPECT_EQ(device_.log.countContaining("error getting recordedFileSize"), 0u);
}

}  // namespace
}  // namespace qv
