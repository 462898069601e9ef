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
  EXPECT_EQ(device_.movies.video().settings.at(platform::settings::kVideoWidth).asDouble(), 1080);
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

TEST_F(ArbitrationTest, TheDisplayLayoutRuleEndsApplicationRecordings) {
  struct Monitor final : platform::DisplayLayoutMonitor {
    void addObserver(std::weak_ptr<platform::DisplayLayoutObserver>) override {}
    void removeObserver(const platform::DisplayLayoutObserver*) override {}
    void invalidate() override {}
  };
  const auto monitor = std::make_shared<Monitor>();
  auto client = game();
  const auto layout = [&](std::vector<int64_t> levels) {
    platform::DisplayLayout shown;
    for (const int64_t level : levels) shown.elements.push_back({"e", level});
    manager_->layoutMonitorDidUpdateDisplayLayout(*monitor, shown);
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
  EXPECT_EQ(openTransactions(), 0);
}

}  // namespace
}  // namespace qv
