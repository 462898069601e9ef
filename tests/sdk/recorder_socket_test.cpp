#include "platform/base/SampleBuffer.h"
#include "protocol/SampleCoding.h"
#include "sdk/client/quorvel/Recorder.h"
#include "tests/sdk/DaemonSocket.h"

namespace qv::client {
namespace {

using platform::Dictionary;
using namespace std::chrono_literals;

/// The library as applications get it.
class RecorderSocket : public DaemonSocket {
 protected:
  void startRecording() {
    kit::Events<quorvel::StartResult> started;
    recorder_->start({.windows = {42}, .width = 4, .height = 4, .capture = true},
                     [&](quorvel::StartResult result) { started.add(std::move(result)); });
    daemon_.object->takeCall().reply({Dictionary(), false, false});
    daemonEnd_ = daemon_.connections.next();
    EXPECT_FALSE(started.next().error);
  }

  std::unique_ptr<quorvel::Recorder> recorder_;
};

/// Samples may be dropped, what tells their timeline may not, and neither overtakes the other.
TEST_F(RecorderSocket, EachSampleIsPlacedByTheTimelineToldBeforeIt) {
  constexpr int kSamples = 200;
  kit::Events<quorvel::SampleTime> times;
  quorvel::RecorderOptions options;
  options.executor = [](const std::function<void()>& work) { work(); };
  options.events.audioSample = [&](const quorvel::AudioSample& sample) { times.add(sample.presentationTime); };
  recorder_ = quorvel::Recorder::create(std::move(options));
  startRecording();
  const platform::AudioStreamDescription format{
      1000, platform::kAudioFormatLinearPCM, platform::kAudioFormatFlagIsSignedInteger, 2, 1, 2, 1, 16, 0};
  for (int64_t i = 0; i < kSamples; ++i) {
    // Captured every 11 ms, 10 of which are a pause; 1 ms long.
    platform::SampleTimingInfo timing{};
    timing.presentationTimeStamp = platform::MediaTime::make(11 * i, 1000);
    send(timelineCallOf(platform::MediaTime::make(10 * i, 1000)));
    send(captureCallOf(SoundMessage{SampleType::AppAudio, {1, 2}, format, 1, timing}));
  }
  for (int i = 0; i < kSamples; ++i) ASSERT_EQ(times.next(), i * 1ms);
}

}  // namespace
}  // namespace qv::client
