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
