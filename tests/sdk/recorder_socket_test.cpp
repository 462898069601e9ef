#include <gtest/gtest.h>
#include <stdlib.h>

#include "platform/sdbus/SdBusIPC.h"
#include "protocol/QVDaemonProtocol.h"
#include "protocol/SampleCoding.h"
#include "sdk/client/quorvel/Recorder.h"
#include "tests/fakes/AcceptingDelegate.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::client {
namespace {

using platform::Dictionary;
using namespace std::chrono_literals;

/// The library as applications get it, over a real socket, with a daemon of the test's in this process.
class RecorderSocket : public ::testing::Test {
 protected:
  RecorderSocket() {
    ::setenv("XDG_RUNTIME_DIR", folder_.path().c_str(), 1);
    service_ = std::make_unique<platform::SdBusIPCService>();
    listener_ = service_->createListener(kServiceName);
    listener_->setDelegate(&daemon_, queue_);
    EXPECT_FALSE(listener_->resume());
  }
  ~RecorderSocket() override {
    recorder_.reset();
    listener_.reset();
    service_.reset();
    queue_.sync([] {});
  }
  void send(OutgoingCall call) { daemonEnd_->call(call.member, std::move(call.arguments), {}, {}); }
  void startRecording() {
    kit::Events<quorvel::StartResult> started;
    recorder_->start({.windows = {42}, .width = 4, .height = 4, .capture = true},
                     [&](quorvel::StartResult result) { started.add(std::move(result)); });
    daemon_.object->takeCall().reply({Dictionary(), false, false});
    daemonEnd_ = daemon_.connections.next();
    EXPECT_FALSE(started.next().error);
  }

  const kit::ScratchFolder folder_;
  platform::SerialQueue queue_{"test daemon"};
  fakes::AcceptingDelegate daemon_{daemonProtocol(), clientProtocol()};
  std::unique_ptr<platform::SdBusIPCService> service_;
  std::unique_ptr<platform::IPCListener> listener_;
  std::shared_ptr<platform::IPCConnection> daemonEnd_;
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
