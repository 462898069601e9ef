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

}  // namespace
}  // namespace qv
