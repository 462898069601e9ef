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
  EXPECT_EQ(client.request("discardRecordingWithHandler")->failureName(), requesterror::kNotRecording);
  client.disconnect();
  EXPECT_TRUE(TestClient(device_, "com.example.nobody", 0).isEnded()) << "a peer that has gone";
  EXPECT_FALSE(TestClient(device_, "com.example.first", 1).isEnded());
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
  platform::Dictionary state;
  for (const char* key : {"isRecording", "isBroadcasting", "microphoneEnabled", "isSystemRecording",
                          "hasUserConsentForMicrophone", "hasUserConsentForCamera", "microphoneEnabledPersistent"}) {
    state[key] = Value(false);
  }
  const platform::Dictionary fresh = state;
  EXPECT_EQ(client.state(), fresh);
  client.request("setMicrophoneEnabled", {Value(true)});
  EXPECT_EQ(client.state(), fresh) << "of nothing that is recorded";
  const auto set = [&](const char* member, const char* key, Value value) {
    client.request(member, {value});
    state[key] = std::move(value);
    EXPECT_EQ(client.state(), state) << member;
  };
  set("setHasUserConsentForMicrophone", "hasUserConsentForMicrophone", Value(true));
  set("setHasUserConsentForCamera", "hasUserConsentForCamera", Value(true));
  set("setMicrophoneEnabledPersistent", "microphoneEnabledPersistent", Value(true));
  set("setBroadcastURL", "broadcastURL", Value("https://example.com/live"));
  client.request("setBroadcastURL", {Value("")});
  state.erase("broadcastURL");
  EXPECT_EQ(client.state(), state);
  client.disconnect();
  EXPECT_EQ(game().state(), fresh);
}

TEST_F(RequestsTest, AnErrorHasItsTextByWhicheverWayItReachesAClient) {
  device_.disk.addFile("/System/Library/Frameworks/Quorvel.framework/Resources/en.lproj/Localizable.strings",
                       R"("RECORDING_ERROR_FAILED_TO_START" = "It did not begin.";
                          "RECORDING_ERROR_FAILED_TO_SAVE" = "It was not kept.";
                          "RECORDING_ERROR_INVALID_BROADCAST_SESSION" = "Nobody broadcasts.";
                          "RECORDING_ERROR_INTERRUPTED" = "Another took over.";)");
  const auto textOf = [](const Value& error) {
    return platform::decodeError(error.asDictionary())->localizedDescription();
  };
  auto client = game();
  EXPECT_EQ(textOf(client.start({.width = 0})->values.at(0)), "It did not begin.");
  EXPECT_EQ(textOf(client.request("saveVideoToCameraRoll", {Value("file:///none.mp4")})->values.at(0)),
            "It was not kept.");
  EXPECT_EQ(textOf(client.start({.broadcast = true})->values.at(0)), "Nobody broadcasts.");
  client.start();
  auto other = chat();
  other.start();
  EXPECT_EQ(textOf(client.object().takeCall().arguments.at(0)), "Another took over.");
  client.start();
  device_.disk.removeItem(device_.movies.last().url.path());
  EXPECT_EQ(textOf(client.stop()->values.at(1)), "It was not kept.");
}

}  // namespace
}  // namespace qv
