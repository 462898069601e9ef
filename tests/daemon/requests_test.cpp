#include "daemon/RequestErrors.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

using RequestsTest = QuietDaemonTest;

TEST_F(RequestsTest, ACallerWithoutBundleIsServedAsFarAsItGoes) {
  TestClient client(device_, "", 900);
  EXPECT_EQ(client.start()->code(), errorcode::kFailedToStart);
  EXPECT_TRUE(client.state().empty());
  EXPECT_EQ(client.stop()->failureName(), requesterror::kNotRecording);
  EXPECT_GT(device_.log.countContaining("Info.json"), 0u);
}

TEST_F(RequestsTest, RequestsWithoutAnAnswerFailByName) {
  auto client = game();
  EXPECT_EQ(client.stop()->failureName(), requesterror::kNotRecording);
  client.start();
  EXPECT_EQ(client.request("discardRecordingWithHandler")->failureName(), requesterror::kRecording);
  EXPECT_TRUE(client.isRecording());
}

TEST_F(RequestsTest, EveryRequestIsServed) {
  auto client = game();
  for (const auto& operation : daemonProtocol().operations) {
    client.request(operation.member.c_str(), platform::IPCArguments(operation.arguments.size()));
    EXPECT_EQ(device_.log.count("nobody serves " + operation.member), 0u) << operation.member;
  }
  EXPECT_FALSE(client.state().empty());
}

TEST_F(RequestsTest, StateHoldsWhatTheClientSet) {
  auto client = game();
  EXPECT_EQ(client.state().size(), 7u);
  client.request("setHasUserConsentForMicrophone", {Value(true)});
  client.request("setMicrophoneEnabledPersistent", {Value(true)});
  client.request("setBroadcastURL", {Value("https://example.com/live")});
  const auto state = client.state();
  EXPECT_TRUE(valueForKey(state, "hasUserConsentForMicrophone").asBool());
  EXPECT_TRUE(valueForKey(state, "microphoneEnabledPersistent").asBool());
  EXPECT_EQ(valueForKey(state, "broadcastURL").asString(), "https://example.com/live");
}

TEST_F(RequestsTest, StopCanTrimAndHandsOnTheWholeMovieWhereThatFails) {
  auto client = game();
  const auto stopTrimmed = [&](double start, double end) {
    client.start();
    sendFrame(kSecond);
    const auto answer = client.request("stopRecordingWithStartClipDuration", {Value(start), Value(end)});
    EXPECT_EQ(answer->code(1), 0);
    return platform::URL(answer->values[0].asString()).path();
  };
  EXPECT_TRUE(stopTrimmed(2, 3).ends_with("/Game_trimmed.mp4"));
  EXPECT_TRUE(stopTrimmed(5, 0).ends_with("/Game.mp4"));
  device_.exports.result = platform::ExportStatus::Failed;
  EXPECT_TRUE(stopTrimmed(2, 3).ends_with("/Game.mp4"));
}

}  // namespace
}  // namespace qv
