#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

class ArbitrationTest : public DaemonTest {
 protected:
  ArbitrationTest() { suppressAlert(); }
};

TEST_F(ArbitrationTest, AStartEndsTheRecordingOfAnotherApplication) {
  auto first = game();
  auto second = chat();
  first.start();
  sendFrame(kSecond);
  EXPECT_EQ(second.start()->code(), 0);
  EXPECT_EQ(first.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(first.lastMovie(), "");
  EXPECT_TRUE(second.isRecording());
  EXPECT_FALSE(first.isRecording());
  EXPECT_EQ(openTransactions(), 1);
  // A start that is refused later has ended the running recording all the same.
  device_.disk.setFreeSize(0);
  EXPECT_EQ(first.start()->code(), errorcode::kInsufficientStorage);
  EXPECT_EQ(second.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(ArbitrationTest, ARestartIsNotTouchedByTheEndOfTheFormerRecording) {
  auto client = game();
  client.start();
  sendFrame(kSecond);
  const auto former = device_.movies.movies.back();
  EXPECT_EQ(client.start()->code(), 0);
  EXPECT_EQ(former->status, platform::AssetWriterStatus::Completed);
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_TRUE(client.isRecording());
  EXPECT_EQ(openTransactions(), 1);
  EXPECT_EQ(device_.keepAlive.begun, 2);
  sendFrame(2 * kSecond);
  EXPECT_EQ(client.stop()->code(1), 0);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(ArbitrationTest, ANewConnectionReplacesTheOldOneAndKeepsTheSession) {
  auto old = game();
  old.start();
  auto fresh = game();
  EXPECT_TRUE(old.isEnded());
  EXPECT_TRUE(fresh.isRecording());
  sendFrame(kSecond);
  EXPECT_EQ(fresh.stop()->code(1), 0);
}

TEST_F(ArbitrationTest, ADisconnectedApplicationLosesItsRecordingASystemRecordingGoesOn) {
  auto client = game();
  client.start();
  client.disconnect();
  EXPECT_EQ(openTransactions(), 0);
  auto system = systemUI();
  EXPECT_EQ(system.start({.width = 1920, .height = 1080, .system = true})->code(), 0);
  EXPECT_EQ(device_.screen.mode, platform::DisplayCloneMode::MirrorScreen);
  system.disconnect();
  EXPECT_EQ(openTransactions(), 1);
  auto back = systemUI();
  EXPECT_TRUE(back.isRecording());
  sendFrame(kSecond);
  auto next = game();
  next.start();
  EXPECT_EQ(device_.photoLibrary.stored.size(), 1u);
  EXPECT_EQ(back.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
}

TEST_F(ArbitrationTest, ASystemRecordingFollowsTheFront) {
  device_.deviceInfo.booleans["RegionalBehaviorShutterClick"] = true;
  device_.applications.frontmost = "com.example.game";
  auto system = systemUI();
  system.start({.width = 1920, .height = 1080, .system = true});
  device_.run();
  EXPECT_EQ(device_.tap.tap->process, 100);
  EXPECT_EQ(device_.movies.video().settings.at(platform::settings::kVideoWidth).asDouble(), 1080)
      << "never wider than tall";
  device_.applications.report(platform::kApplicationForeground, 200, true);
  device_.run();
  EXPECT_EQ(device_.tap.tap->process, 200);
  device_.applications.report(platform::kApplicationBackground, 100, false);
  device_.run();
  EXPECT_TRUE(device_.tap.tap->running);
  device_.applications.report(platform::kApplicationBackground, 200, false);
  device_.run();
  EXPECT_FALSE(device_.tap.tap->running);
  sendFrame(kSecond);
  system.stop();
  EXPECT_EQ(device_.sounds.played, (std::vector<uint32_t>{1117, 1118}));
  EXPECT_FALSE(device_.applications.handler);
}

TEST_F(ArbitrationTest, TheFollowerSeesASwitchDuringTheStartAndOutlivesTheFormerRecordingsEnd) {
  install("Other", "com.example.other-system", 400);
  TestClient other(device_, "com.example.other-system", 400, {{"com.tarnwick.private.quorvel", Value(true)}});
  auto system = systemUI();
  system.start({.system = true});
  sendFrame(kSecond);
  device_.applications.frontmost = "com.example.game";
  other.postStart({.system = true});
  // The front is asked for when the recording begins; before it has started it changes.
  while (device_.movies.movies.size() < 2) ASSERT_TRUE(device_.executor.runOne());
  device_.applications.frontmost = "com.example.chat";
  device_.run();
  EXPECT_EQ(device_.tap.tap->process, 200);
  EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  // The former client goes: that recording's end is long over.
  system.disconnect();
  ASSERT_TRUE(device_.applications.handler);
  device_.applications.report(platform::kApplicationForeground, 100, true);
  device_.run();
  EXPECT_EQ(device_.tap.tap->process, 100);
}

TEST_F(ArbitrationTest, ADeviceThatInterruptsKeepsTheSystemRecordingInThePhotoLibrary) {
  auto system = systemUI();
  system.start({.system = true});
  sendFrame(kSecond);
  // What is recorded from the warning on is left out, unless the warning is taken back.
  manager_->notifySystemRecordingMayBeStopped();
  manager_->notifySystemRecordingResumed();
  device_.run();
  sendFrame(2 * kSecond);
  manager_->notifySystemRecordingMayBeStopped();
  device_.run();
  sendFrame(3 * kSecond);
  manager_->stopSystemRecordingWithInterruption();
  manager_->stopSystemRecordingWithInterruption();
  device_.run();
  EXPECT_EQ(device_.movies.last().sessionEnd, platform::MediaTime::make(2 * kSecond, platform::kHostTimescale));
  EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(device_.photoLibrary.stored.size(), 1u);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(ArbitrationTest, TheDisplayLayoutRuleEndsApplicationRecordings) {
  struct Monitor final : platform::DisplayLayoutMonitor {
    void addObserver(std::weak_ptr<platform::DisplayLayoutObserver> to) override { observer = std::move(to); }
    void removeObserver(const platform::DisplayLayoutObserver*) override { observer.reset(); }
    void invalidate() override {}
    std::weak_ptr<platform::DisplayLayoutObserver> observer;
  };
  const auto monitor = std::make_shared<Monitor>();
  manager_->setLayoutMonitor(monitor);
  auto client = game();
  const auto layout = [&](std::vector<int64_t> levels) {
    platform::DisplayLayout shown;
    for (const int64_t level : levels) shown.elements.push_back({"e", level});
    if (const auto to = monitor->observer.lock()) to->layoutMonitorDidUpdateDisplayLayout(*monitor, shown);
    device_.run();
  };
  client.start();
  sendFrame(kSecond);
  layout({0});
  layout({0, 0, 5});  // two ordinary ones and one above: counted, nothing ends
  EXPECT_TRUE(client.isRecording());
  layout({0});
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kContentResize});
  EXPECT_TRUE(client.lastMovie().ends_with("Game.mp4"));
  EXPECT_EQ(client.request("saveVideoToCameraRoll", {Value(client.lastMovie())})->code(), 0);
  EXPECT_EQ(openTransactions(), 0);
}

}  // namespace
}  // namespace qv
