#include <gtest/gtest.h>
#include <stdlib.h>

#include <cstring>
#include <filesystem>
#include <future>

#include "platform/sdbus/SdBusIPC.h"
#include "protocol/QVDaemonProtocol.h"
#include "protocol/SampleCoding.h"
#include "sdk/client/quorvel/Recorder.h"
#include "tests/fakes/FakeIPC.h"

namespace qv::client {
namespace {

using platform::Dictionary;
using platform::IPCConnection;
using platform::Value;
using namespace std::chrono_literals;

/// A value that another thread brings; throws after a time that only a hang reaches.
template <typename T>
T take(std::promise<T>& promise) {
  auto future = promise.get_future();
  if (future.wait_for(30s) != std::future_status::ready) throw std::runtime_error("nothing came");
  return future.get();
}

/// The library as applications get it, over a real socket, with a daemon of the test's in this process.
class RecorderSocket : public ::testing::Test, protected platform::IPCListenerDelegate {
 protected:
  RecorderSocket() {
    char directory[] = "/tmp/quorvel-test-XXXXXX";
    directory_ = ::mkdtemp(directory);
    ::setenv("XDG_RUNTIME_DIR", directory_.c_str(), 1);
  }
  ~RecorderSocket() override {
    recorder_.reset();
    stopDaemon();
    std::filesystem::remove_all(directory_);
  }
  void startDaemon() {
    service_ = std::make_unique<platform::SdBusIPCService>();
    listener_ = service_->createListener(kServiceName);
    listener_->setDelegate(this, queue_);
    const auto error = listener_->resume();
    ASSERT_FALSE(error) << error->description();
  }
  void stopDaemon() {
    if (listener_) listener_->invalidate();
    queue_.sync([this] {
      if (daemonEnd_) daemonEnd_->invalidate();
      daemonEnd_.reset();
    });
    listener_.reset();
    service_.reset();
  }
  bool listenerShouldAcceptNewConnection(platform::IPCListener&,
                                         const std::shared_ptr<IPCConnection>& connection) override {
    connection->setExportedInterface(daemonProtocol(), daemon_);
    connection->setRemoteInterface(clientProtocol());
    connection->resume();
    daemonEnd_ = connection;
    return true;
  }
  void send(OutgoingCall call) {
    queue_.sync([&] { daemonEnd_->call(call.member, std::move(call.arguments), {}, {}); });
  }
  void startRecording() {
    std::promise<quorvel::StartResult> started;
    recorder_->start({.windows = {42}, .width = 4, .height = 4, .capture = true},
                     [&](quorvel::StartResult result) { started.set_value(std::move(result)); });
    const auto call = daemon_->takeCall();
    ASSERT_EQ(call.arguments.size(), 8u);
    EXPECT_EQ(call.arguments[0], Value(platform::Array{42u}));
    call.reply({Dictionary(), false, false});
    const auto result = take(started);
    EXPECT_FALSE(result.error);
  }

  std::string directory_;
  platform::SerialQueue queue_{"test daemon"};
  const std::shared_ptr<fakes::RecordingExportedObject> daemon_ = std::make_shared<fakes::RecordingExportedObject>();
  std::unique_ptr<platform::SdBusIPCService> service_;
  std::unique_ptr<platform::IPCListener> listener_;
  std::shared_ptr<IPCConnection> daemonEnd_;
  std::unique_ptr<quorvel::Recorder> recorder_;
};

TEST_F(RecorderSocket, RecordsCapturesAndStops) {
  startDaemon();
  std::promise<quorvel::VideoFrame> arrived;
  quorvel::RecorderOptions options;
  options.events.videoFrame = [&](quorvel::VideoFrame frame) { arrived.set_value(std::move(frame)); };
  recorder_ = quorvel::Recorder::create(std::move(options));
  startRecording();

  auto pixels = *platform::SharedFrame::create({4, 4, 16, platform::PixelFormat::BGRX});
  std::memset(pixels->mutableBytes().data(), 0x77, 64);
  std::promise<bool> returned;
  std::shared_ptr<void> hold(nullptr, [&](void*) { returned.set_value(true); });
  platform::SampleTimingInfo timing;
  timing.presentationTimeStamp = platform::MediaTime::make(3, 2);
  send(captureCallOf(PictureMessage{platform::SharedFrameRef(std::move(hold), pixels.get()), timing}));
  auto frame = take(arrived);
  EXPECT_EQ(frame.pixels[63], 0x77);
  EXPECT_EQ(frame.presentationTime, 1500ms);
  EXPECT_EQ(frame.duration, std::nullopt);
  frame = {};
  EXPECT_TRUE(take(returned)) << "the frame came back to the daemon";

  std::promise<quorvel::StopResult> stopped;
  recorder_->stop([&](quorvel::StopResult result) { stopped.set_value(std::move(result)); });
  EXPECT_EQ(daemon_->takeCall().member, "stopRecordingWithHandler");
  const auto result = take(stopped);
  ASSERT_TRUE(result.error) << "the daemon let the call go unanswered";
  EXPECT_EQ(result.error->code, quorvel::kErrorUnknown);
  EXPECT_NE(result.error->text.find("NoReply"), std::string::npos) << result.error->text;
}

/// Samples may be dropped, what tells their timeline may not, and neither overtakes the other.
TEST_F(RecorderSocket, EachSampleIsPlacedByTheTimelineToldBeforeIt) {
  constexpr int kSamples = 200;
  startDaemon();
  std::vector<quorvel::SampleTime> times;
  std::promise<bool> isComplete;
  quorvel::RecorderOptions options;
  options.executor = [](const std::function<void()>& work) { work(); };
  options.events.audioSample = [&](const quorvel::AudioSample& sample) {
    times.push_back(sample.presentationTime);
    if (times.size() == kSamples) isComplete.set_value(true);
  };
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
  ASSERT_TRUE(take(isComplete));
  for (int i = 0; i < kSamples; ++i) EXPECT_EQ(times[static_cast<size_t>(i)], i * 1ms);
}

}  // namespace
}  // namespace qv::client
