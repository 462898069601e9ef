#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using namespace std::chrono_literals;
using enum platform::UserAlertAnswer;

/// Nobody is asked for consent in these: the indicator is the only notice.
class IndicatorTest : public QuietDaemonTest {
 protected:
  /// Time goes on, for clocks and timers.
  void pass(std::chrono::seconds time) {
    device_.clock.advance(time);
    device_.timers.advance(time);
    device_.run();
  }
  void sendPictureOfNow() { sendFrame(device_.clock.hostTime().value); }
  void press() {
    device_.statusBar.press();
    device_.run();
  }
  void answer(platform::UserAlertAnswer answer) {
    device_.alerts.answer(answer);
    device_.run();
  }
  std::string shown() {
    const auto& bar = device_.statusBar.shown;
    return bar ? bar->text + " " + bar->time : "nothing";
  }
  /// What the client was told of recordings since the last time, in order.
  static std::vector<std::string> notices(TestClient& client) {
    std::vector<std::string> told;
    while (client.object().callCount() > 0) {
      const auto call = client.object().takeCall();
      if (call.member == "updateScreenRecordingState") told.emplace_back(call.arguments[0].asBool() ? "on" : "off");
      if (call.member == "recordingTimerDidUpdate") told.push_back(call.arguments[0].asString());
    }
    return told;
  }
};

TEST_F(IndicatorTest, ShowsTheTimeWithoutPausesAsLongAsARecordingGoesOn) {
  auto game = this->game();
  EXPECT_EQ(shown(), "nothing");
  game.start();
  EXPECT_EQ(shown(), "RECORDING_STATUS_BAR 0:00");
  sendPictureOfNow();
  pass(5s);
  EXPECT_EQ(shown(), "RECORDING_STATUS_BAR 0:05");
  game.send("pauseRecording");
  pass(60s);
  EXPECT_EQ(shown(), "RECORDING_PAUSED_STATUS_BAR 0:05");
  game.stop();
  EXPECT_EQ(shown(), "nothing");
  EXPECT_EQ(device_.timers.pending(), 0u);
  game.start();
  EXPECT_EQ(shown(), "RECORDING_STATUS_BAR 0:00") << "a new recording has a time of its own";
}

TEST_F(IndicatorTest, APressAsksOnceAndStopsOnlyIfTheUserWantsIt) {
  auto game = this->game();
  game.start();
  sendPictureOfNow();
  press();
  press();
  ASSERT_EQ(device_.alerts.shown.size(), 1u);
  answer(Cancelled);
  EXPECT_TRUE(game.isRecording());
  press();
  answer(Default);
  EXPECT_EQ(game.takeEnds(), (std::vector<int64_t>{errorcode::kInterrupted}));
  EXPECT_FALSE(contentAt(game.lastMovie()).empty()) << "it is the application's to save";
  EXPECT_EQ(shown(), "nothing");
  game.start();
  press();
  game.stop();
  EXPECT_FALSE(device_.alerts.shown.back()->visible) << "there is nothing to stop any more";
  auto ui = systemUI();
  ui.start({.system = true});
  sendPictureOfNow();
  press();
  answer(Default);
  EXPECT_EQ(ui.takeEnds(), (std::vector<int64_t>{errorcode::kInterrupted}));
  EXPECT_EQ(device_.photoLibrary.contents.size(), 1u) << "nobody else would save a system recording";
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(IndicatorTest, TheSystemsOwnClientsAreToldAndMayHaveAStatusBarInstead) {
  using Told = std::vector<std::string>;
  device_.deviceInfo.booleans["ownStatusBar"] = true;
  auto ui = systemUI();
  auto game = this->game();
  game.start();
  EXPECT_EQ(shown(), "nothing");
  sendPictureOfNow();
  pass(1s);
  EXPECT_EQ(notices(ui), (Told{"on", "0:00", "0:01"}));
  ui.disconnect();
  auto again = systemUI();
  EXPECT_EQ(notices(again), (Told{"on", "0:01"})) << "what is so when it connects";
  game.stop();
  EXPECT_EQ(notices(again), (Told{"off"}));
  EXPECT_EQ(notices(game), Told{}) << "an application has no right to know";
}

}  // namespace
}  // namespace qv
