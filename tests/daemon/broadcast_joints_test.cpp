#include <algorithm>

#include "extensions/AnswerDeadline.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Dictionary;
using platform::ExtensionItem;
using platform::Value;

/// Broadcasts one after another, and beside recordings.
class BroadcastJointsTest : public DaemonTest {
 protected:
  BroadcastJointsTest() { suppressAlert(); }
  ~BroadcastJointsTest() override {
    // What still waits for an extension's answer gives up.
    device_.timers.advance(std::chrono::minutes(5));
    device_.run();
  }
  static constexpr const char* kSamples = "QVBroadcastProcessModeSampleBuffer";

  void setUp(TestClient& client, double clipDuration = 5) {
    const auto answer =
        client.request("setupBroadcastWithHostBundleID",
                       {Value(client.bundleID()), Value(client.bundleID() + ".setup"),
                        Value(QVBroadcastConfiguration{clipDuration, {}}.encode()), Value(Dictionary{})});
    EXPECT_EQ(answer->code(), 0);
  }
  void install(const TestClient& client, const std::string& mode = {}) {
    device_.extensions.install(client.bundleID() + ".upload", broadcastpoint::kUpload, mode);
  }
  /// A start of a broadcast of samples whose extension is ready.
  TestClient::Slot startSamples(TestClient& client, bool system = false) {
    auto started = client.postStart({.broadcast = true, .system = system});
    device_.run();
    extension_.connect();
    device_.run();
    extension_.call("ping");
    device_.run();
    return started;
  }
  /// Pictures and their sound, in tenths of a second.
  void play(int64_t from, int64_t to) {
    for (int64_t tenth = from; tenth < to; ++tenth) {
      sendFrame(tenth * kSecond / 10);
      ASSERT_TRUE(device_.tap.fill(4410 * 2, static_cast<uint64_t>(tenth * kSecond / 10), 4410));
      device_.run();
    }
  }

  fakes::FakeBroadcastExtension extension_{device_.ipc, device_.extensions, device_.executor};
};

TEST_F(BroadcastJointsTest, ASetUpServesOneBroadcastAlsoOverAReconnectionOfItsHost) {
  auto client = game();
  install(client);
  for (int former = 0; former < 3; ++former) {
    client.start();
    client.stop();
  }
  setUp(client);
  client.disconnect();
  auto again = game();
  EXPECT_EQ(again.start({.broadcast = true})->code(), 0);
  again.stop();
  EXPECT_EQ(again.start({.broadcast = true})->code(), errorcode::kInvalidBroadcastSession);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(BroadcastJointsTest, ALateAnswerOfAFormerBroadcastChangesNothingOfTheNext) {
  auto client = game();
  install(client);
  setUp(client, 1);
  ASSERT_EQ(client.start({.broadcast = true})->code(), 0);
  play(100, 115);
  client.stop();
  const size_t former = device_.extensions.requests.size();
  ASSERT_GE(former, 1u);
  setUp(client, 1);
  ASSERT_EQ(client.start({.broadcast = true})->code(), 0);
  play(200, 203);
  const auto item = [](const char* title, Value value) {
    return ExtensionItem{title, {{platform::kGenericDataType, std::move(value)}}};
  };
  device_.extensions.complete(
      0, std::vector<ExtensionItem>{
             item(broadcastitem::kBroadcastConfiguration, Value(QVBroadcastConfiguration{100, {}}.encode())),
             item(broadcastitem::kServiceInfo, Value(Dictionary{{"viewers", Value(int64_t{5})}}))});
  if (former > 1) device_.extensions.complete(former - 1, platform::Error{"d", 1, {}});
  device_.run();
  EXPECT_EQ(client.object().callCount(), 0u);
  play(203, 225);
  EXPECT_GT(device_.extensions.requests.size(), former) << "clips are as long as before";
  EXPECT_TRUE(client.isRecording());
  client.stop();
}

TEST_F(BroadcastJointsTest, SamplesLeaveTheUnsavedMovieAlone) {
  auto client = game();
  install(client, kSamples);
  client.start();
  sendFrame(kSecond);
  const std::string movie = client.stop()->values[0].asString();
  setUp(client);
  const auto started = startSamples(client);
  ASSERT_TRUE(*started);
  EXPECT_EQ((*started)->code(), 0);
  sendFrame(2 * kSecond);
  client.stop();
  EXPECT_EQ(contentAt(movie), "movie 0");
  EXPECT_EQ(client.request("saveVideoToCameraRoll", {Value(movie)})->code(), 0);
}

TEST_F(BroadcastJointsTest, TheExtensionIsToldWhoIsInFrontWhenItBegins) {
  auto system = systemUI();
  install(system, kSamples);
  setUp(system);
  device_.applications.frontmost = "com.example.chat";
  (void)startSamples(system, true);
  EXPECT_EQ(std::count(extension_.received.begin(), extension_.received.end(),
                       Dictionary{{broadcastpayload::kFrontmostApp, Value("com.example.chat")}}),
            1);
  system.stop();
}

TEST_F(BroadcastJointsTest, AnExtensionThatFailsAtOnceLeavesNoSourceOn) {
  device_.deviceInfo.audioCaptureDevice = true;
  auto client = game();
  install(client, kSamples);
  setUp(client);
  extension_.answers = false;
  const auto started = startSamples(client);
  extension_.connection->invalidate();
  device_.run();
  ASSERT_TRUE(*started);
  EXPECT_EQ((*started)->code(), errorcode::kInvalidBroadcastSession);
  EXPECT_TRUE(client.takeEnds().empty());
  EXPECT_TRUE(areSourcesOff());
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(BroadcastJointsTest, AStartWhoseExtensionCannotBeEnabledIsAnsweredTheReason) {
  device_.deviceInfo.internalBuild = false;  // nothing would suppress an alert
  auto client = game();
  install(client, kSamples);
  setUp(client);
  device_.extensions.launchError = platform::Error{"launch", 7, {}};
  EXPECT_EQ(client.start({.broadcast = true})->code(), 7);
  device_.extensions.launchError.reset();
  setUp(client);
  const auto started = client.postStart({.broadcast = true});
  device_.run();
  EXPECT_FALSE(*started);
  device_.timers.advance(kExtensionPatience);  // nobody connects
  device_.run();
  ASSERT_TRUE(*started);
  EXPECT_EQ((*started)->code(), errorcode::kInvalidBroadcastSession);
  EXPECT_TRUE(device_.alerts.shown.empty());
  EXPECT_FALSE(client.isRecording());
  EXPECT_EQ(openTransactions(), 0);
}

}  // namespace
}  // namespace qv
