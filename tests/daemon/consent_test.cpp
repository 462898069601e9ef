#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::UserAlertAnswer;
using platform::Value;

class ConsentTest : public DaemonTest {
 protected:
  /// The answer to a start whose alert was answered in this way.
  TestClient::Answer startAnswering(TestClient& client, const TestClient::StartOptions& options,
                                    UserAlertAnswer answer) {
    EXPECT_EQ(client.start(options), std::nullopt);
    device_.alerts.answer(answer);
    device_.run();
    return *client.answer();
  }
};

TEST_F(ConsentTest, TwoButtonsRecordOrDecline) {
  auto client = game();
  EXPECT_EQ(startAnswering(client, {}, UserAlertAnswer::Other).code(), errorcode::kUserDeclined);
  EXPECT_EQ(startAnswering(client, {}, UserAlertAnswer::Cancelled).code(), errorcode::kUserDeclined);
  EXPECT_EQ(openTransactions(), 0);
  EXPECT_EQ(startAnswering(client, {}, UserAlertAnswer::Default).code(), 0);
  const auto& request = device_.alerts.shown.back()->request;
  EXPECT_EQ(request.header, "ACKNOWLEDGEMENT_ALERT_TITLE");
  EXPECT_TRUE(request.alternateButton.empty());
  EXPECT_EQ(device_.alerts.shown.size(), 3u);
  client.stop();
  EXPECT_EQ(client.start()->code(), 0);  // exempt now
  EXPECT_EQ(device_.alerts.shown.size(), 3u);
}

TEST_F(ConsentTest, ThreeButtonsKeepOrDropTheMicrophone) {
  device_.deviceInfo.audioCaptureDevice = true;
  auto client = game();
  const TestClient::StartOptions withMicrophone{.microphone = true};
  EXPECT_EQ(startAnswering(client, withMicrophone, UserAlertAnswer::Default).code(), errorcode::kUserDeclined);
  EXPECT_FALSE(startAnswering(client, {}, UserAlertAnswer::Default).values[1].asBool()) << "none was asked for";
  client.stop();
  auto answer = startAnswering(client, withMicrophone, UserAlertAnswer::Other);
  EXPECT_EQ(answer.code(), 0);
  EXPECT_FALSE(answer.values[1].asBool());
  client.stop();
  // Allowed without the microphone only, so it is asked again.
  answer = startAnswering(client, withMicrophone, UserAlertAnswer::Alternate);
  EXPECT_TRUE(answer.values[1].asBool());
  client.stop();
  EXPECT_EQ(client.start(withMicrophone)->code(), 0);
}

TEST_F(ConsentTest, ExemptionLastsEightMinutesInTheBackground) {
  auto client = game();
  startAnswering(client, {}, UserAlertAnswer::Default);
  client.stop();
  client.request("clientDidResignActive");
  device_.clock.advanceSeconds(480);
  client.request("clientDidResignActive");  // the first date stays
  client.request("clientDidBecomeActive");
  EXPECT_EQ(client.start()->code(), 0);
  client.stop();
  device_.clock.advanceSeconds(1);
  client.request("clientDidBecomeActive");
  EXPECT_EQ(client.start(), std::nullopt);
  client.disconnect();
  EXPECT_FALSE(device_.alerts.shown.back()->visible);

  auto next = game();
  startAnswering(next, {}, UserAlertAnswer::Default);
  next.stop();
  next.request("clientDidResignActive");
  device_.clock.advanceSeconds(481);
  EXPECT_EQ(game().start(), std::nullopt) << "one that connects anew comes from the background";
}

TEST_F(ConsentTest, OnlyAnInternalBuildSuppressesTheAlert) {
  auto client = game();
  suppressAlert();
  EXPECT_EQ(client.start()->code(), 0);
  client.stop();
  device_.deviceInfo.internalBuild = false;
  EXPECT_EQ(client.start(), std::nullopt);
}

TEST_F(ConsentTest, AClientThatDiesTakesItsAlertAlongAndTheNextStartIsServed) {
  auto first = game();
  auto second = chat();
  first.start();
  second.start();
  const auto asked = device_.alerts.shown;
  ASSERT_EQ(asked.size(), 2u);
  first.disconnect();
  EXPECT_FALSE(asked[0]->visible);
  // An answer that was on its way finds nobody.
  asked[0]->handler(UserAlertAnswer::Default);
  asked[1]->handler(UserAlertAnswer::Default);
  asked[1]->handler(UserAlertAnswer::Default);
  device_.run();
  EXPECT_EQ(second.answer()->code(), 0);
  EXPECT_EQ(openTransactions(), 1);
  EXPECT_EQ(device_.movies.movies.size(), 1u);
}

TEST_F(ConsentTest, AnAlertThatCannotBeShownDeclines) {
  device_.alerts.fails = true;
  auto client = game();
  EXPECT_EQ(client.start()->code(), errorcode::kUserDeclined);
}

TEST_F(ConsentTest, OthersAreServedWhileOneIsAskedAndItHasOneStartAtATime) {
  auto asked = game();
  auto other = chat();
  EXPECT_EQ(other.start({.capture = true}), std::nullopt);
  EXPECT_EQ(device_.movies.prepared, 0) << "a capture writes no movie";
  EXPECT_EQ(asked.start(), std::nullopt);
  EXPECT_EQ(device_.movies.prepared, 1) << "while the user reads";
  EXPECT_EQ(asked.start()->code(), errorcode::kFailedToStart);  // one start at a time
  EXPECT_EQ(other.state().size(), 7u);
}

}  // namespace
}  // namespace qv
