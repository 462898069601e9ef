#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

using ArbitrationTest = QuietDaemonTest;

TEST_F(ArbitrationTest, AStartThatIsRefusedLateHasEndedTheRunningRecordingAllTheSame) {
  auto first = game();
  auto second = chat();
  first.start();
  device_.disk.setFreeSize(0);
  EXPECT_EQ(second.start()->code(), errorcode::kInsufficientStorage);
  EXPECT_EQ(first.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
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
  record(client);
  client.disconnect();
  EXPECT_EQ(contentAt(device_.movies.last().url.absoluteString()), "") << "nobody's";
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
  EXPECT_TRUE(device_.exports.sessions.empty()) << "unmixed";
  EXPECT_EQ(back.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
}

TEST_F(ArbitrationTest, AClientThatDiesBeforeTheAnswerToItsStartEndsARecordingUnlessItIsTheSystems) {
  const auto startUntilItRecords = [this](TestClient& client, bool system) {
    client.postStart({.system = system});
    while (!manager_->sessions().find(client.bundleID())->isRecording()) {
      ASSERT_TRUE(device_.executor.runOne());
    }
  };
  auto system = systemUI();
  startUntilItRecords(system, true);
  system.disconnect();
  EXPECT_TRUE(systemUI().isRecording());
  auto killed = game();
  startUntilItRecords(killed, false);
  TestClient relaunched(device_, "com.example.game", 100, {}, false);
  const auto started = relaunched.postStart({});
  device_.run();
  ASSERT_TRUE(*started);
  EXPECT_EQ((*started)->code(), 0) << "the former start is over at once";
  EXPECT_EQ(openTransactions(), 1);
}

TEST_F(ArbitrationTest, AStopWhoseClientIsReplacedMeanwhileTellsTheNextOne) {
  int told = 0;
  for (int pieces = 0; pieces < kPieces; ++pieces) {
    auto system = systemUI();
    system.postStart({.system = true});
    system.post("stopRecordingWithHandler");
    runWork(pieces);
    auto next = systemUI();
    for (const int64_t code : next.takeEnds()) told += code == errorcode::kInterrupted ? 1 : 0;
    if (next.isRecording()) next.stop();
    EXPECT_TRUE(areSourcesOff()) << pieces;
    EXPECT_EQ(openTransactions(), 0) << pieces;
  }
  EXPECT_GT(told, 0);
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
  system.request("pauseRecording");
  system.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{77})});
  EXPECT_TRUE(device_.screen.last().running) << "neither is for a system recording";
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
  const auto late = device_.applications.handler;
  system.stop();
  EXPECT_EQ(device_.sounds.played, (std::vector<uint32_t>{1117, 1118}));
  EXPECT_FALSE(device_.applications.handler);
  // Reports that were on their way find nobody.
  device_.applications.handler = late;
  for (int gone = 0; gone < 3; ++gone) {
    device_.applications.report(platform::kApplicationForeground, 100, true);
    device_.run();
    EXPECT_TRUE(areSourcesOff()) << gone;
    if (gone == 0) system.disconnect();
    if (gone == 1) manager_.reset();
  }
}

TEST_F(ArbitrationTest, TheFollowerSeesAChangeDuringTheStartAndOutlivesTheFormerRecordingsEnd) {
  install("First", "com.example.first", 1);
  install("Other", "com.example.other-system", 400);
  TestClient other(device_, "com.example.other-system", 400, {{"com.tarnwick.private.quorvel", Value(true)}});
  auto system = systemUI();
  const struct {
    std::optional<std::string> before, after;
    pid_t tapped;
  } cases[] = {{std::nullopt, "com.example.first", 1},
               {"com.example.first", std::nullopt, 1},
               {"com.example.game", "com.example.chat", 200}};
  for (const auto& [before, after, tapped] : cases) {
    record(system, {.system = true});
    const size_t former = device_.movies.movies.size();
    device_.applications.frontmost = before;
    other.postStart({.system = true});
    // The front is asked for when the recording begins; before it has started it changes.
    while (device_.movies.movies.size() == former) ASSERT_TRUE(device_.executor.runOne());
    device_.applications.frontmost = after;
    device_.run();
    ASSERT_TRUE(device_.tap.tap);
    EXPECT_EQ(device_.tap.tap->running, after.has_value());
    EXPECT_EQ(device_.tap.tap->process, tapped);
    EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  }
  // The former client goes: that recording's end is long over.
  system.disconnect();
  ASSERT_TRUE(device_.applications.handler);
  device_.applications.report(platform::kApplicationForeground, 100, true);
  device_.run();
  EXPECT_EQ(device_.tap.tap->process, 100);
}

TEST_F(ArbitrationTest, ADeviceThatInterruptsKeepsTheSystemRecordingInThePhotoLibrary) {
  auto system = systemUI();
  record(system, {.system = true});
  device_.photoLibrary.failure = platform::Error::posix(ENOSPC);
  manager_->stopSystemRecordingWithInterruption();
  device_.run();
  EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(contentAt(system.lastMovie()), "movie 0") << "a refused one is its application's";
  device_.photoLibrary.failure.reset();
  device_.photoLibrary.stored.clear();
  record(system, {.system = true});
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

}  // namespace
}  // namespace qv
