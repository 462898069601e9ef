#include <tuple>

#include "session/MovieNames.h"
#include "session/VideoSize.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Size;
using platform::Value;

using LifecycleTest = QuietDaemonTest;

TEST_F(LifecycleTest, SizesAreClampedByDeviceAndPreference) {
  const auto clamped = [this](Size size) {
    return _maximumSizeWithSize(size, device_.preferences.store, device_.deviceInfo);
  };
  EXPECT_EQ(clamped({3840, 2160}), (Size{1920, 1080}));
  EXPECT_EQ(clamped({1080, 2400}), (Size{864, 1920}));
  EXPECT_EQ(clamped({1000, 800}), (Size{1000, 800}));
  device_.deviceInfo.idiom = platform::UserInterfaceIdiom::Tablet;
  EXPECT_EQ(clamped({2048, 1536}), (Size{1920, 1440}));
  device_.deviceInfo.integers["ChipID"] = 0x8960;
  EXPECT_EQ(clamped({2048, 1536}), (Size{1600, 1200}));
  device_.preferences.set(R"({"QVFullResCapture": true})");
  EXPECT_EQ(clamped({3840, 2160}), (Size{3840, 2160}));
}

TEST_F(LifecycleTest, FileNamesHoldWhateverAnAppIsCalled) {
  const MovieNames names(device_.platform, device_.texts);
  const auto name = [&](const std::string& displayName) {
    device_.bundles.addApplication(
        "Game", R"({"CFBundleIdentifier": "com.example.game", "CFBundleDisplayName": ")" + displayName + R"("})");
    return names.applicationMoviePath("com.example.game").substr(std::string(fakes::kStore).size() + 1);
  };
  EXPECT_EQ(name("Comet Run"), "Comet Run.mp4");
  EXPECT_EQ(name("../../etc/cron"), "_.:..:etc:cron.mp4");
  EXPECT_EQ(name(""), "com.example.game.mp4");
  EXPECT_EQ(name("a\\u0001b\\u007fc"), "abc.mp4");
  EXPECT_EQ(name(std::string(400, 'x')), std::string(200, 'x') + ".mp4");
  EXPECT_EQ(name(std::string(199, 'x') + "\u00e9"), std::string(199, 'x') + ".mp4") << "no half a character";
  const std::string path = names.screenMoviePath();
  EXPECT_NE(path.find("/ScreenRecording_"), std::string::npos);
  EXPECT_EQ(path.find(':'), std::string::npos);
}

TEST_F(LifecycleTest, PauseStopsTheSourcesAndResumeKeepsTheFile) {
  auto client = game();
  record(client);
  client.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{77})});
  EXPECT_TRUE(client.isRecording()) << "nothing is paused";
  client.request("pauseRecording");
  client.request("pauseRecording");
  EXPECT_FALSE(device_.screen.last().running);
  EXPECT_TRUE(device_.tap.tap->disposed);
  EXPECT_EQ(device_.screen.mode, platform::DisplayCloneMode::Off);
  device_.applications.owners[5] = 100;
  client.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{5})});
  EXPECT_TRUE(device_.screen.last().running);
  EXPECT_EQ(device_.screen.contexts, std::set<uint32_t>{5});
  EXPECT_EQ(device_.movies.movies.size(), 1u);
  client.request("pauseRecording");
  client.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{77})});  // another's
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kNoContextIDMatch});
  EXPECT_TRUE(client.lastMovie().ends_with("Game.mp4"));
}

TEST_F(LifecycleTest, ATapThatRunsTooLateDoesNotStartTheScreen) {
  auto client = game();
  client.start();
  const auto listener = device_.tap.tap->listener;
  client.request("pauseRecording");
  EXPECT_FALSE(device_.screen.last().running);
  if (listener) listener();
  device_.run();
  EXPECT_FALSE(device_.screen.last().running);
}

TEST_F(LifecycleTest, ARefusedFrameEndsTheRecording) {
  device_.movies.startFails = true;
  auto client = game();
  record(client);
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kFailedToSave});
  const auto& payload = device_.metrics.messages.back().payload;
  EXPECT_EQ(valueForKey(payload, "EndReason").asInteger(), errorcode::kFailedToSave);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(LifecycleTest, MetricsCountBothStretchesOfAPausedRecording) {
  device_.deviceInfo.audioCaptureDevice = true;
  auto client = game();
  client.start({.microphone = true});
  device_.clock.advanceSeconds(7.25);
  sendFrame(kSecond);
  ASSERT_TRUE(device_.tap.fill(10, kSecond));
  for (int i = 0; i < 2; ++i) speak(1, 10);
  device_.run();
  client.request("pauseRecording");
  device_.clock.advanceSeconds(100);
  device_.applications.owners[5] = 100;
  client.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{5})});
  device_.clock.advanceSeconds(5.25);
  client.request("reportCameraUsage", {Value(int32_t{2})});
  client.stop();
  const auto& message = device_.metrics.messages.back();
  EXPECT_EQ(std::tuple(message.clientType, message.clientVersion, message.sessionID, message.batchEvent,
                       message.userInfoRequired, message.category, message.type),
            std::tuple(23, 1, 0, true, true, 1, 0));
  EXPECT_EQ(message.clientName, "Quorvel");
  EXPECT_EQ(message.serviceName, "InAppRecording");
  EXPECT_EQ(message.payload.size(), 15u);
  EXPECT_TRUE(device_.log.contains(
      "QVReportingAgent: reportingEvent:1 payload:{ActiveDuration=13, AppAudioCaptureRate=2, AppAudioFrameCount=1, "
      "BackCameraUsed=0, BroadcastExtensionBundleID=\"\", ClientAppBundleID=\"\", EndReason=0, FrontCameraUsed=1, "
      "MicCaptureRate=43, MicFrameCount=2, RecordedFileSize=7, VideoCaptureHeight=720, VideoCaptureRate=60, "
      "VideoCaptureWidth=1280, VideoFrameCount=1}"));
  auto system = systemUI();
  system.start({.system = true});
  system.request("reportCameraUsage", {Value(int32_t{1})});
  sendFrame(kSecond);
  system.stop();
  const auto& back = device_.metrics.messages.back();
  EXPECT_EQ(back.serviceName, "SystemRecording");
  EXPECT_TRUE(valueForKey(back.payload, "BackCameraUsed").asBool());
  EXPECT_FALSE(valueForKey(back.payload, "FrontCameraUsed").asBool());
}

TEST_F(LifecycleTest, ShuttingDownCompletesTheMovie) {
  auto client = game();
  record(client);
  bool down = false;
  manager_->shutDown([&] { down = true; });
  device_.run();
  EXPECT_TRUE(down);
  EXPECT_EQ(device_.movies.last().status, platform::AssetWriterStatus::Completed);
}

TEST_F(LifecycleTest, ADaemonThatBeginsMakesItsStoreAndFinishesWhatACrashLeft) {
  const auto begin = [this] { manager_ = QVRecordingManager::create(device_.platform, captureManager_); };
  const auto end = [this] {
    manager_.reset();
    device_.run();
  };
  end();
  EXPECT_EQ(device_.purgeableSpace.callbacks.purge(1, 3), 0) << "nobody is there to be asked";
  device_.disk.removeItem(fakes::kStore);
  begin();
  EXPECT_TRUE(device_.disk.itemExists(fakes::kStore));
  end();
  device_.disk.addFile(std::string(fakes::kStore) + "/Game.mp4", "broken off");
  device_.salvage.states["Game.mp4"] = platform::MovieState::Unfinished;
  begin();
  EXPECT_EQ(device_.salvage.salvaged.size(), 1u);
}

}  // namespace
}  // namespace qv
