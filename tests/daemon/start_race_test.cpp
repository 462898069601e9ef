#include <algorithm>
#include <array>
#include <cstring>

#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

constexpr std::string_view kAllow = "allow", kStart = "start", kStop = "stop", kLeave = "leave";

/// What one application does, a step at a time; between two steps anything may happen.
struct Actor {
  TestClient client;
  bool microphone;  ///< by which its alert is known
  std::vector<std::string_view> script;
  size_t next = 0;
  std::optional<TestClient::Answer> startAnswer = std::nullopt;
  std::optional<TestClient::Answer> stopAnswer = std::nullopt;
};

/// One race of two applications on a device of its own.
class Race : public DaemonTest {
 public:
  using Script = std::vector<std::string_view>;
  Race(Script ofGame, Script ofChat) : actors_{{{game(), false, ofGame}, {chat(), true, ofChat}}} {
    device_.deviceInfo.audioCaptureDevice = true;
  }
  void TestBody() override {}

  /// Runs the scripts merged in this order, and after each step so many pieces of the daemon's work (-1: all).
  void run(const std::vector<int>& order, const std::vector<int>& pieces) {
    for (size_t i = 0; i < order.size(); ++i) {
      act(actors_[static_cast<size_t>(order[i])]);
      for (int done = 0; done != pieces[i] && device_.executor.runOne(); ++done) {
      }
      if (pieces[i] < 0) expectOneRecordingAtMost();
    }
    for (Actor& actor : actors_) collect(actor);
  }
  Actor& actor(size_t index) { return actors_[index]; }
  using DaemonTest::openTransactions;

 private:
  void act(Actor& actor) {
    const std::string_view step = actor.script[actor.next++];
    if (step == kStart) actor.client.postStart({.microphone = actor.microphone});
    if (step == kLeave) actor.client.leave();
    if (step == kAllow) {
      // The user answers once there is a question.
      while (!alertOf(actor) && !actor.client.answer() && device_.executor.runOne()) {
      }
      if (const auto alert = alertOf(actor)) {
        alert->handler(actor.microphone ? platform::UserAlertAnswer::Alternate : platform::UserAlertAnswer::Default);
      }
    }
    if (step == kStop) {
      while (!actor.client.answer() && device_.executor.runOne()) {
      }
      collect(actor);
      actor.client.post("stopRecordingWithHandler");
    }
  }
  std::shared_ptr<fakes::FakeUserAlerts::Shown> alertOf(const Actor& actor) {
    for (const auto& alert : device_.alerts.shown) {
      if (alert->visible && alert->request.alternateButton.empty() != actor.microphone) return alert;
    }
    return nullptr;
  }
  /// An answer belongs to the request that waits for it.
  static void collect(Actor& actor) {
    if (!actor.client.answer()) return;
    auto& answer = actor.startAnswer ? actor.stopAnswer : actor.startAnswer;
    if (!answer) answer = actor.client.answer();
  }
  void expectOneRecordingAtMost() {
    int recording = 0;
    for (const Actor& actor : actors_) {
      recording += manager_->sessions().recordingSessionForBundleID(actor.client.bundleID())->isRecording() ? 1 : 0;
    }
    EXPECT_LE(recording, 1);
    EXPECT_EQ(openTransactions(), recording);
  }

  std::array<Actor, 2> actors_;
};

/// Every merging of the two scripts, with every choice of how far the daemon gets in between.
template <typename Check>
void forEachOrdering(const Race::Script& ofGame, const Race::Script& ofChat, const std::vector<int>& progress,
                     const Check& check) {
  std::vector<int> order(ofGame.size(), 0);
  order.resize(ofGame.size() + ofChat.size(), 1);
  do {
    std::vector<size_t> choice(order.size() - 1, 0);
    size_t carry = 0;
    while (carry < choice.size()) {
      std::vector<int> pieces;
      std::string trace;
      for (const size_t index : choice) pieces.push_back(progress[index]);
      pieces.push_back(-1);
      for (size_t i = 0; i < order.size(); ++i) {
        trace += (order[i] == 0 ? " game+" : " chat+") + std::to_string(pieces[i]);
      }
      SCOPED_TRACE(trace);
      Race race(ofGame, ofChat);
      race.run(order, pieces);
      check(race);
      for (carry = 0; carry < choice.size() && ++choice[carry] == progress.size(); ++carry) choice[carry] = 0;
    }
  } while (std::next_permutation(order.begin(), order.end()));
}

TEST(StartRaceTest, EveryOrderingOfTwoStartsLeavesOneRecordingAndTellsBothOnce) {
  forEachOrdering({kStart, kAllow}, {kStart, kAllow}, {0, 1, 2, 4, 7, -1}, [](Race& race) {
    EXPECT_EQ(race.openTransactions(), 1);
    for (const size_t index : {0u, 1u}) {
      Actor& actor = race.actor(index);
      ASSERT_TRUE(actor.startAnswer);
      // It records and heard of no end; or it heard of it once, as the start's answer or in a message.
      const size_t told = actor.client.takeEnds().size() + (actor.startAnswer->code() != 0 ? 1 : 0);
      EXPECT_EQ(told, actor.client.isRecording() ? 0u : 1u);
    }
  });
}

TEST(StartRaceTest, AStopOfOneAndTheDeathOfTheOtherLeaveNothingOpen) {
  forEachOrdering({kStart, kAllow, kStop}, {kStart, kAllow, kLeave}, {0, 3, -1}, [](Race& race) {
    Actor& first = race.actor(0);
    ASSERT_TRUE(first.startAnswer);
    ASSERT_TRUE(first.stopAnswer);
    // One answer, message or movie for each recording that had begun.
    const size_t told = first.client.takeEnds().size() + (first.stopAnswer->failure ? 0 : 1);
    EXPECT_EQ(told, first.startAnswer->code() == 0 ? 1u : 0u);
    EXPECT_EQ(race.openTransactions(), 0);
  });
}

class ClientDeathTest : public DaemonTest {};

TEST_F(ClientDeathTest, DuringAnAlertTakesItAlongAndTheNextStartIsServed) {
  auto first = game();
  auto second = chat();
  first.start();
  second.start();
  const auto asked = device_.alerts.shown;
  ASSERT_EQ(asked.size(), 2u);
  first.disconnect();
  EXPECT_FALSE(asked[0]->visible);
  // An answer that was on its way finds nobody.
  asked[0]->handler(platform::UserAlertAnswer::Default);
  asked[1]->handler(platform::UserAlertAnswer::Default);
  device_.run();
  EXPECT_EQ(second.answer()->code(), 0);
  EXPECT_EQ(openTransactions(), 1);
}

TEST_F(ClientDeathTest, BeforeTheAnswerToItsStartEndsARecordingUnlessItIsTheSystems) {
  suppressAlert();
  const auto startUntilItRecords = [this](TestClient& client, bool system) {
    client.postStart({.system = system});
    while (!manager_->sessions().recordingSessionForBundleID(client.bundleID())->isRecording()) {
      ASSERT_TRUE(device_.executor.runOne());
    }
  };
  auto system = systemUI();
  startUntilItRecords(system, true);
  system.disconnect();
  EXPECT_TRUE(systemUI().isRecording());
  auto killed = game();
  startUntilItRecords(killed, false);
  auto relaunched = game();
  EXPECT_FALSE(relaunched.isRecording());
  EXPECT_EQ(openTransactions(), 0);
}

}  // namespace
}  // namespace qv
