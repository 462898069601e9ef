#include "tests/daemon/BroadcastFixture.h"
#include "tests/fakes/LogRecorder.h"

namespace qv {
namespace {

using platform::UserAlertAnswer;
using platform::Value;

/// The same program under several users, and programs that become others.
class IdentityTest : public BroadcastFixture {
 protected:
  static constexpr uid_t kStranger = 5;
  void startAllowed(TestClient& client) {
    EXPECT_EQ(client.start(), std::nullopt);
    device_.alerts.answer(UserAlertAnswer::Default);
    device_.run();
    EXPECT_EQ(client.answer()->code(), 0);
    sendFrame(kSecond);
  }
  fakes::LogRecorder log_;
};

TEST_F(IdentityTest, AnotherUserIsKeptOutAsLongAsTheApplicationIsThere) {
  auto client = game();
  EXPECT_TRUE(gameOf(kStranger).isEnded()) << "connected";
  startAllowed(client);
  auto stranger = gameOf(kStranger);
  EXPECT_TRUE(stranger.isEnded());
  EXPECT_TRUE(stranger.start()->failure);
  EXPECT_FALSE(client.isEnded());
  EXPECT_TRUE(client.isRecording());
  stop(client);
  EXPECT_EQ(log_.countContaining("com.example.game is in use by user 0"), 2u);
}

TEST_F(IdentityTest, ASystemRecordingWithoutItsClientKeepsAnotherUserOut) {
  auto system = systemUI();
  record(system, {.system = true});
  system.disconnect();
  const platform::Dictionary entitlements{{"com.tarnwick.private.quorvel", Value(true)}};
  TestClient other(device_, "com.example.system", 301, entitlements, true, kStranger);
  EXPECT_TRUE(other.isEnded());
  auto back = systemUI();
  EXPECT_TRUE(back.isRecording());
  EXPECT_EQ(back.stop()->code(1), 0);
  back.disconnect();
  TestClient later(device_, "com.example.system", 301, entitlements, true, kStranger);
  EXPECT_FALSE(later.isEnded());
  EXPECT_FALSE(valueForKey(later.state(), "isSystemRecording").asBool()) << "a session of its own";
}

TEST_F(IdentityTest, AnotherUserInheritsNothingAndTakesNothing) {
  std::string movie;
  {
    auto client = game();
    install(client, kSamples);
    startAllowed(client);
    movie = stop(client);
    client.request("setBroadcastURL", {Value("https://live")});
    EXPECT_EQ(setUp(client), 0);
    client.disconnect();
  }
  {
    auto stranger = gameOf(kStranger);
    EXPECT_EQ(valueForKey(stranger.state(), "broadcastURL"), Value());
    EXPECT_EQ(stranger.start({.broadcast = true})->code(), errorcode::kInvalidBroadcastSession);
    EXPECT_EQ(save(stranger, movie), errorcode::kFailedToSave);
    stranger.request("discardRecordingWithHandler");
    const size_t asked = device_.alerts.shown.size();
    startAllowed(stranger);
    EXPECT_EQ(device_.alerts.shown.size(), asked + 1) << "what the user allowed was another application";
    EXPECT_NE(stop(stranger), movie);
    stranger.disconnect();
  }
  auto back = game();
  EXPECT_NE(contentAt(movie), "");
  EXPECT_EQ(save(back, movie), 0);
  const auto started = startSamples(back);
  ASSERT_TRUE(started->has_value()) << "neither asked nor without its broadcast";
  EXPECT_EQ((*started)->code(), 0);
}

TEST_F(IdentityTest, WindowsAndSoundOfAnotherUsersProcessAreNotTheCallers) {
  constexpr pid_t kTheirs = 101;
  constexpr pid_t kSecond = 102;
  device_.bundles.setProcess(kTheirs, "/Applications/Game/bin/run", kStranger);
  device_.bundles.setProcess(kSecond, "/Applications/Game/bin/run");
  device_.applications.owners = {{7, kTheirs}, {8, kSecond}};
  suppressAlert();
  auto client = game();
  EXPECT_EQ(client.start({.contexts = {7}})->code(), errorcode::kFailedToStart);
  EXPECT_EQ(client.start({.contexts = {8}})->code(), 0);
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{kTheirs})});
  EXPECT_EQ(device_.tap.tap->process, 100);
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{kSecond})});
  EXPECT_EQ(device_.tap.tap->process, kSecond);
}

TEST_F(IdentityTest, AProcessThatHasBecomeAnotherProgramIsRefusedAndLosesItsConnection) {
  const auto expectRefusal = [this](TestClient client, auto request) {
    log_.clear();
    client.becomeAnotherProgram();
    EXPECT_FALSE(client.isEnded());
    request(client);
    EXPECT_TRUE(client.isEnded());
    EXPECT_EQ(log_.countContaining("is no longer the program that connected as " + client.bundleID()), 1u);
    EXPECT_EQ(openTransactions(), 0);
    EXPECT_TRUE(areSourcesOff());
  };
  expectRefusal(systemUI(), [](TestClient& client) {
    EXPECT_EQ(client.start({.system = true})->code(), errorcode::kEntitlements);
  });
  expectRefusal(game(), [](TestClient& client) { EXPECT_EQ(client.start()->code(), errorcode::kFailedToStart); });
  expectRefusal(game(), [](TestClient& client) { EXPECT_EQ(setUp(client), errorcode::kEntitlements); });
  suppressAlert();
  auto recording = game();
  recording.start();
  expectRefusal(std::move(recording), [](TestClient& client) {
    client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{100})});
  });
  EXPECT_EQ(game().start()->code(), 0) << "the application itself is served again";
}

TEST_F(IdentityTest, AnApplicationThatWasUpdatedKeepsItsRecordingAndStartsNoOther) {
  suppressAlert();
  auto client = game();
  record(client);
  client.isUpdated();
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{-1})});
  EXPECT_EQ(device_.tap.tap->process, 100);
  EXPECT_EQ(client.start()->code(), errorcode::kFailedToStart);
  EXPECT_EQ(log_.countContaining("no longer com.example.game's"), 2u);
  EXPECT_TRUE(client.isRecording());
  stop(client);
}

}  // namespace
}  // namespace qv
