#include "daemon/RequestErrors.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

class RequestsTest : public DaemonTest {
 protected:
  RequestsTest() { suppressAlert(); }
};

TEST_F(RequestsTest, RecordsFromStartToMovie) {
  auto client = game();
  const auto started = client.start();
  ASSERT_TRUE(started);
  EXPECT_EQ(started->code(), 0);
  EXPECT_EQ(openTransactions(), 1);
  sendFrame(10 * kSecond);
  const auto stopped = client.stop();
  EXPECT_EQ(stopped->code(1), 0);
  EXPECT_EQ(platform::URL(stopped->values[0].asString()).path(), std::string(fakes::kStore) + "/Game.mp4");
  EXPECT_EQ(openTransactions(), 0);
  EXPECT_FALSE(client.isRecording());
  EXPECT_EQ(device_.metrics.messages.size(), 1u);
}

TEST_F(RequestsTest, StartIsRefusedWithTheErrorOfItsFirstFailingCheck) {
  auto client = game();
  const auto codeOf = [&](const TestClient::StartOptions& options) { return client.start(options)->code(); };
  EXPECT_EQ(codeOf({.system = true}), errorcode::kEntitlements);
  device_.applications.owners = {{7, 100}, {8, 200}, {9, 999}};
  EXPECT_EQ(codeOf({.contexts = {7, 8}}), errorcode::kFailedToStart);
  EXPECT_EQ(codeOf({.contexts = {0}}), errorcode::kFailedToStart);
  EXPECT_EQ(codeOf({.contexts = {9}}), errorcode::kFailedToStart);
  EXPECT_EQ(codeOf({.width = 0, .height = 0}), errorcode::kFailedToStart);
  EXPECT_EQ(codeOf({.width = std::nan(""), .height = 720}), errorcode::kFailedToStart);
  EXPECT_EQ(codeOf({.width = 1e9, .height = 1e9}), errorcode::kFailedToStart);
  EXPECT_EQ(codeOf({.broadcast = true}), errorcode::kInvalidBroadcastSession);
  EXPECT_EQ(platform::decodeError(client.answer()->values[0].asDictionary())->localizedDescription(), "");
  device_.disk.setFreeSize(100'000'000);
  EXPECT_EQ(codeOf({}), errorcode::kInsufficientStorage);
  device_.disk.setFreeSize(100'000'001);
  device_.applications.states["com.example.game"] = platform::kApplicationBackground;
  EXPECT_EQ(codeOf({}), errorcode::kFailedToStart);
  EXPECT_EQ(openTransactions(), 0);
  device_.applications.states["com.example.game"] = platform::kApplicationForeground;
  EXPECT_EQ(codeOf({.contexts = {7}}), 0);
  EXPECT_EQ(device_.screen.contexts, std::set<uint32_t>{7});
}

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

TEST_F(RequestsTest, OnlyAHandedMovieIsSavedAndRemoved) {
  auto client = game();
  client.start();
  sendFrame(kSecond);
  const std::string movie = client.stop()->values[0].asString();
  const std::string path = platform::URL(movie).path();
  device_.disk.addFile(path, "movie");
  device_.disk.addFile("/etc/passwd", "root");
  EXPECT_EQ(client.request("saveVideoToCameraRoll", {Value("file:///etc/passwd")})->code(), errorcode::kFailedToSave);
  auto other = chat();
  EXPECT_EQ(other.request("saveVideoToCameraRoll", {Value(movie)})->code(), errorcode::kFailedToSave);
  EXPECT_TRUE(device_.photoLibrary.stored.empty());
  EXPECT_EQ(client.request("saveVideoToCameraRoll", {Value(movie)})->code(), 0);
  ASSERT_EQ(device_.photoLibrary.stored.size(), 1u);
  EXPECT_NE(device_.photoLibrary.stored[0].path().find("QVQuorvel_Final"), std::string::npos);
  EXPECT_FALSE(device_.disk.itemExists(path));
  EXPECT_TRUE(device_.disk.itemExists("/etc/passwd"));
}

TEST_F(RequestsTest, PurgingEndsARecordingOnlyWhenUrgent) {
  auto client = game();
  const auto& callbacks = device_.purgeableSpace.callbacks;
  client.start();
  device_.disk.addFile(std::string(fakes::kStore) + "/old.mp4", "12345");
  EXPECT_EQ(callbacks.purge(1, 2), 0);
  EXPECT_TRUE(client.isRecording());
  EXPECT_GE(callbacks.purge(1, 3), 5);
  device_.run();
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kInsufficientStorage});
  EXPECT_EQ(openTransactions(), 0);
  EXPECT_FALSE(device_.disk.itemExists(std::string(fakes::kStore) + "/old.mp4"));
}

}  // namespace
}  // namespace qv
