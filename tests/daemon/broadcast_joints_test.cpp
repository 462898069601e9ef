#include <algorithm>

#include "tests/daemon/BroadcastFixture.h"

namespace qv {
namespace {

using platform::Dictionary;
using platform::ExtensionItem;
using platform::Value;

/// Broadcasts one after another, and beside recordings.
class BroadcastJointsTest : public BroadcastFixture {
 protected:
  BroadcastJointsTest() { suppressAlert(); }
};

TEST_F(BroadcastJointsTest, ASetUpServesOneBroadcastAlsoOverAReconnectionOfItsHost) {
  auto client = game();
  install(client);
  for (int former = 0; former < 3; ++former) {
    client.start();
    client.stop();
  }
  EXPECT_EQ(setUp(client), 0);
  client.disconnect();
  auto again = game();
  EXPECT_EQ(again.start({.broadcast = true})->code(), 0);
  EXPECT_EQ(setUp(again), 0) << "for the next one";
  again.stop();
  EXPECT_EQ(again.start({.broadcast = true})->code(), 0);
  again.stop();
  EXPECT_EQ(again.start({.broadcast = true})->code(), errorcode::kInvalidBroadcastSession);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(BroadcastJointsTest, ALateAnswerOfAFormerBroadcastChangesNothingOfTheNext) {
  auto client = game();
  install(client);
  EXPECT_EQ(setUp(client, clipsOf(1)), 0);
  ASSERT_EQ(client.start({.broadcast = true})->code(), 0);
  play(100, 115);
  client.stop();
  const size_t former = device_.extensions.requests.size();
  ASSERT_GE(former, 1u);
  EXPECT_EQ(setUp(client, clipsOf(1)), 0);
  ASSERT_EQ(client.start({.broadcast = true})->code(), 0);
  play(200, 203);
  device_.extensions.complete(
      0,
      std::vector<ExtensionItem>{item(broadcastitem::kBroadcastConfiguration, Value(clipsOf(100))),
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
  const std::string movie = recordMovie(client);
  EXPECT_EQ(setUp(client), 0);
  const auto started = startSamples(client);
  ASSERT_TRUE(*started);
  EXPECT_EQ((*started)->code(), 0);
  sendFrame(2 * kSecond);
  client.stop();
  EXPECT_EQ(contentAt(movie), "movie 0");
  EXPECT_EQ(save(client, movie), 0);
}

TEST_F(BroadcastJointsTest, TheExtensionIsToldWhoIsInFrontWhenItBegins) {
  auto system = systemUI();
  install(system, kSamples);
  EXPECT_EQ(setUp(system, clipsOf(5), "com.example.system.setup"), 0);
  device_.applications.frontmost = "com.example.chat";
  (void)startSamples(system, true);
  EXPECT_EQ(std::count(extension_.received.begin(), extension_.received.end(),
                       Dictionary{{broadcastpayload::kFrontmostApp, Value("com.example.chat")}}),
            1);
  device_.applications.report(platform::kApplicationForeground, 100, true);
  device_.run();
  EXPECT_EQ(std::count_if(extension_.received.begin(), extension_.received.end(),
                          [](const auto& each) { return each.contains(broadcastpayload::kFrontmostApp); }),
            1)
      << "the first only";
  system.stop();
}

TEST_F(BroadcastJointsTest, AnExtensionThatFailsAtOnceLeavesNoSourceOn) {
  device_.deviceInfo.audioCaptureDevice = true;
  auto client = game();
  install(client, kSamples);
  EXPECT_EQ(setUp(client), 0);
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
  EXPECT_EQ(setUp(client), 0);
  device_.extensions.launchError = platform::Error{"launch", 7, {}};
  EXPECT_EQ(client.start({.broadcast = true})->code(), 7);
  device_.extensions.launchError.reset();
  EXPECT_EQ(setUp(client), 0);
  const auto started = client.postStart({.broadcast = true});
  device_.run();
  EXPECT_FALSE(*started);
  EXPECT_EQ(chat().state().size(), 7u) << "others are served meanwhile";
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
