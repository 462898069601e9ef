#include <future>

#include "platform/base/RawRecord.h"
#include "platform/base/SampleBuffer.h"
#include "protocol/QVSharedFrameObject.h"
#include "tests/sdk/RecorderFixture.h"

namespace qv::client {
namespace {

using platform::AudioStreamDescription;
using platform::MediaTime;
using platform::SampleTimingInfo;
using platform::SharedFrame;

const SampleTimingInfo kTiming{MediaTime::make(1, 60), MediaTime::make(5'000'000'000, platform::kHostTimescale),
                               MediaTime::invalid()};
/// Big-endian, packed.
const AudioStreamDescription kFormat{44100, platform::kAudioFormatLinearPCM, 14, 2, 1, 2, 1, 16, 0};

class RecorderCapture : public RecorderFixture {
 protected:
  RecorderCapture() { startRecording(); }

  /// Sends a 2 x 2 picture of `fill`; the future is ready when the daemon may use its memory again.
  std::future<void> sendFrame(uint8_t fill) {
    auto frame = *SharedFrame::create({2, 2, 8, platform::PixelFormat::BGRX});
    for (uint8_t& byte : frame->mutableBytes()) byte = fill;
    auto returned = std::make_shared<std::promise<void>>();
    auto future = returned->get_future();
    std::shared_ptr<void> hold(nullptr, [returned, frame](void*) { returned->set_value(); });
    const QVSharedFrameObject object(platform::SharedFrameRef(std::move(hold), frame.get()));
    tellClient("captureHandlerWithSample", {object.encodeForIPC(), rawBytes(kTiming)});
    return future;
  }
};

TEST_F(RecorderCapture, AFrameIsTheDaemonsMemoryUntilItIsDropped) {
  auto returned = sendFrame(0x5a);
  run();
  ASSERT_EQ(frames_.size(), 1u);
  const quorvel::VideoFrame& frame = frames_[0];
  EXPECT_EQ(frame.width, 2u);
  EXPECT_EQ(frame.stride, 8u);
  ASSERT_EQ(frame.pixels.size(), 16u);
  EXPECT_EQ(frame.pixels[15], 0x5a);
  EXPECT_EQ(frame.presentationTime, 5s);
  EXPECT_EQ(frame.duration, 16'666'667ns);
  auto copy = frame;
  frames_.clear();
  EXPECT_EQ(returned.wait_for(0s), std::future_status::timeout);
  copy = {};
  EXPECT_EQ(returned.wait_for(20s), std::future_status::ready);
}

TEST_F(RecorderCapture, AnApplicationThatDoesNotKeepUpLosesTheNewest) {
  std::vector<std::function<void()>> waiting;
  quorvel::RecorderOptions options;
  options.events = events();
  options.executor = [&](std::function<void()> work) { waiting.push_back(std::move(work)); };
  recorder_ = std::make_unique<RecorderClient>(ipc_, timers_, executor_, std::move(options));
  recorder_->pause();
  takeLog();
  std::vector<std::future<void>> returned;
  for (uint8_t i = 0; i < 5; ++i) returned.push_back(sendFrame(i));
  run();
  EXPECT_EQ(recorder_->droppedSamples(), 2u);
  EXPECT_EQ(returned[3].wait_for(20s), std::future_status::ready);
  for (auto& work : waiting) std::exchange(work, {})();
  ASSERT_EQ(frames_.size(), 3u);
  EXPECT_EQ(frames_[2].pixels[0], 2);
  sendFrame(9);
  run();
  waiting.back()();
  EXPECT_EQ(frames_.back().pixels[0], 9);
  waiting.clear();
}

TEST_F(RecorderCapture, AudioCarriesItsFormatAndSource) {
  for (const int64_t type : {1, 2, 3})  // no sound is of type 1
    tellClient("captureHandlerWithAudioSample",
               {Data{1, 2, 3, 4}, rawBytes(kFormat), int64_t{2}, type, rawBytes(kTiming)});
  run();
  ASSERT_EQ(samples_.size(), 2u);
  EXPECT_EQ(samples_[0].source, quorvel::AudioSample::Source::Application);
  EXPECT_EQ(samples_[1].source, quorvel::AudioSample::Source::Microphone);
  EXPECT_EQ(samples_[0].bytes, (Data{1, 2, 3, 4}));
  EXPECT_EQ(samples_[0].frameCount, 2);
  EXPECT_EQ(samples_[0].format.sampleRate, 44100);
  EXPECT_EQ(samples_[0].format.channels, 1u);
  EXPECT_TRUE(samples_[0].format.isBigEndian && samples_[0].format.isSigned && !samples_[0].format.isFloat);
  EXPECT_EQ(samples_[0].presentationTime, 5s);
}

TEST_F(RecorderCapture, SoundLiesOnTheTimelineOfThePictures) {
  const auto sendSound = [&](int64_t capturedMilliseconds, int64_t frames, int64_t type = 2) {
    Data bytes(static_cast<size_t>(frames) * 2);
    for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<uint8_t>(i / 2);
    AudioStreamDescription format = kFormat;
    format.sampleRate = 1000;
    SampleTimingInfo timing = kTiming;
    timing.presentationTimeStamp = MediaTime::make(capturedMilliseconds, 1000);
    tellClient("captureHandlerWithAudioSample", {bytes, rawBytes(format), frames, type, rawBytes(timing)});
    run();
  };
  const auto tellPauses = [&](int64_t milliseconds) {
    tellClient("captureTimelineDidChange", {rawBytes(MediaTime::make(milliseconds, 1000))});
  };
  sendSound(1000, 100);
  sendSound(1100, 100);                                // up to the pause; the last picture was that of 1150
  tellClient("captureTimelineDidChange", {Data(23)});  // nonsense changes nothing
  tellPauses(3000);
  sendSound(4160, 20);   // before the end of what was given
  sendSound(4180, 100);  // its first 20 are
  sendSound(4280, 100);
  sendSound(4190, 10, 3);  // the microphone has an end of its own
  tellPauses(10'000);
  sendSound(11'500, 100);  // after a gap
  // When each begins, and how long it is.
  using Placed = std::vector<std::pair<quorvel::SampleTime, int64_t>>;
  Placed placed;
  for (const auto& sample : samples_) placed.emplace_back(sample.presentationTime, sample.frameCount);
  EXPECT_EQ(placed, (Placed{{1000ms, 100}, {1100ms, 100}, {1200ms, 80}, {1280ms, 100}, {1190ms, 10}, {1500ms, 100}}));
  EXPECT_EQ(samples_[2].bytes.size(), 160u);
  EXPECT_EQ(samples_[2].bytes.front(), 20);

  samples_.clear();
  tellPauses(0);
  sendSound(61'000, 10);
  tellPauses(60'000);
  sendSound(61'600, 10);  // far before what lay wrongly
  sendSound(1000, 10);    // captured before its pauses were over
  ASSERT_EQ(samples_.size(), 2u);
  EXPECT_EQ(samples_[1].presentationTime, 1600ms);

  tellPauses(60'000);
  killDaemon();
  startDaemon();
  startRecording();
  sendSound(70'000, 10);
  EXPECT_EQ(samples_.back().presentationTime, 70s) << "another daemon tells its own";
}

}  // namespace
}  // namespace qv::client
