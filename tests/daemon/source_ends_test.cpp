#include <cstring>

#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

/// Sources that are switched, begin or end at an inconvenient moment.
class SourceEndsTest : public DaemonTest {
 protected:
  SourceEndsTest() {
    suppressAlert();
    device_.deviceInfo.audioCaptureDevice = true;
    // A second process of the same application.
    device_.bundles.setProcess(101, "/Applications/Game/bin/helper");
  }
  bool play(int64_t time, uint32_t frames = 441) {
    const bool taken = device_.tap.fill(frames, time);
    device_.run();
    return taken;
  }
  int64_t now() { return device_.clock.hostTime().value; }
};

TEST_F(SourceEndsTest, ALateFailureOfOneRecordingLeavesTheSourcesOfTheNextOn) {
  using Delegate = platform::ScreenCaptureControllerDelegate;
  using Report = std::function<void(Delegate&, platform::ScreenCaptureController&)>;
  const Report reports[] = {[](auto& to, auto& from) { to.screenCaptureControllerWasPreempted(from); },
                            [](auto& to, auto& from) { to.screenCaptureControllerMediaServicesWereReset(from); },
                            [](auto& to, auto& from) { to.screenCaptureControllerDidFailWithStatus(from, -1); }};
  for (const Report& report : reports) {
    for (int pieces = 0; pieces < kPieces; ++pieces) {
      auto first = game();
      auto second = chat();
      record(first, {.microphone = true});
      auto& controller = device_.screen.last();
      const auto delegate = controller.delegate.lock();
      const auto started = second.postStart({.microphone = true});
      runWork(pieces);
      report(*delegate, controller);
      first.leave();
      device_.run();
      ASSERT_TRUE(*started);
      ASSERT_EQ((*started)->code(), 0) << pieces;
      EXPECT_TRUE(device_.tap.tap->running) << pieces;
      EXPECT_EQ(device_.tap.tap->process, 200) << pieces;
      EXPECT_TRUE(device_.deviceCapture.session->running) << pieces;
      EXPECT_EQ(device_.screen.mode, platform::DisplayCloneMode::CloneContexts) << pieces;
      sendFrame(2 * kSecond);
      EXPECT_EQ(second.stop()->code(1), 0) << pieces;
      EXPECT_TRUE(areSourcesOff());
    }
  }
}

TEST_F(SourceEndsTest, AChangeOfSoundThatMeetsTheEndStartsNothing) {
  const std::pair<const char*, Value> changes[] = {{"setMicrophoneEnabled", Value(true)},
                                                   {"updateProcessIDForAudioCaptureWithPID", Value(int32_t{200})}};
  for (const auto& [member, value] : changes) {
    for (int pieces = 0; pieces < kPieces; ++pieces) {
      auto system = systemUI();
      record(system, {.system = true});
      const auto stopped = system.post("stopRecordingWithHandler");
      runWork(pieces);
      system.post(member, {value});
      device_.run();
      ASSERT_TRUE(*stopped);
      EXPECT_EQ((*stopped)->code(1), 0);
      EXPECT_TRUE(areSourcesOff()) << member << " after " << pieces;
      for (const auto& tap : device_.tap.taps) EXPECT_NE(tap->process, 200) << pieces;
      EXPECT_EQ(openTransactions(), 0);
    }
  }
}

TEST_F(SourceEndsTest, AProcessThatChangesBeforeTheFirstTapRunsCostsNoPicture) {
  auto client = game();
  for (const int32_t process : {101, 0}) {
    device_.tap.startsLate = true;
    EXPECT_EQ(client.start()->code(), 0);
    const auto first = device_.tap.tap;
    device_.tap.startsLate = false;
    client.request("updateProcessIDForAudioCaptureWithPID", {Value(process)});
    if (first->listener) first->listener();
    device_.run();
    sendFrame(kSecond);
    EXPECT_EQ(client.stop()->code(1), 0) << process;
  }
}

TEST_F(SourceEndsTest, AnApplicationTapsItsOwnProcessesTheSystemAny) {
  auto client = game();
  client.start();
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{101})});
  EXPECT_EQ(device_.tap.tap->process, 101);
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{200})});
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{1})});
  EXPECT_EQ(device_.tap.tap->process, 101) << "what another application plays is not its own";
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{0})});
  EXPECT_FALSE(device_.tap.tap->running);
  auto system = systemUI();
  system.start({.system = true});
  system.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{200})});
  EXPECT_EQ(device_.tap.tap->process, 200);
}

TEST_F(SourceEndsTest, AChangeOfProcessInAPauseIsTakenUpByTheResume) {
  install("First", "com.example.first", 1);  // of a container
  TestClient client(device_, "com.example.first", 1);
  client.start();
  EXPECT_EQ(device_.tap.tap->process, 1);
  const auto recording = recordingOf(client);
  recording->updateProcessIDForAudioCaptureWithPID(1);
  device_.run();
  EXPECT_EQ(device_.tap.taps.size(), 2u);
  recording->pauseSession();
  recording->updateProcessIDForAudioCaptureWithPID(200);
  recording->checkAndStopAppAudioForPID(200);
  EXPECT_FALSE(device_.tap.tap->running);
  recording->resumeSessionWithContextID(5);
  device_.run();
  EXPECT_EQ(device_.tap.tap->process, 200);
  recording->checkAndStopAppAudioForPID(1);
  EXPECT_TRUE(device_.tap.tap->running) << "of another";
  recording->checkAndStopAppAudioForPID(200);
  EXPECT_FALSE(device_.tap.tap->running);
  client.stop();
}

TEST_F(SourceEndsTest, ASystemRecordingTakesTheMicrophoneWhenItIsOnAnApplicationWhatItsUserAllowed) {
  const auto& session = device_.deviceCapture.session;
  const auto switchOn = [](TestClient& client) { client.request("setMicrophoneEnabled", {Value(true)}); };
  auto client = game();
  client.start();
  switchOn(client);
  EXPECT_EQ(session, nullptr) << "nobody was asked";
  auto system = systemUI();
  system.start({.system = true});
  EXPECT_EQ(session, nullptr);
  switchOn(system);
  const auto first = session;
  ASSERT_TRUE(first && first->running);
  EXPECT_TRUE(valueForKey(system.state(), "microphoneEnabled").asBool());
  switchOn(system);
  EXPECT_EQ(session, first);
  recordingOf(system)->pauseSession();
  switchOn(system);
  EXPECT_FALSE(first->running);
  recordingOf(system)->resumeSessionWithContextID(0);
  device_.run();
  EXPECT_TRUE(session != first && session->running);
}

TEST_F(SourceEndsTest, SoundBeforeALateFirstFrameGoesBackToItsTap) {
  auto client = game();
  client.start();
  for (int64_t tenth = 0; tenth < 20; ++tenth) ASSERT_TRUE(play(now() + tenth * kSecond / 10)) << tenth;
  EXPECT_TRUE(device_.movies.appAudio().samples.empty());
  sendFrame(now() + 2 * kSecond);
  ASSERT_TRUE(play(now() + 2 * kSecond));
  EXPECT_EQ(device_.movies.appAudio().samples.size(), 1u);
}

TEST_F(SourceEndsTest, SoundAfterASwitchOfTheProcessIsCutAtAPause) {
  auto client = game();
  client.start();
  sendFrame(now());
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{101})});
  // Of 100 ms that the tap hands over at its stop, half were played before the pause.
  device_.tap.tap->atStop = [this] { (void)device_.tap.fill(4410, now() - kSecond / 20); };
  client.request("pauseRecording");
  int64_t frames = 0;
  for (const auto& sample : device_.movies.appAudio().samples) frames += sample->numSamples();
  EXPECT_EQ(frames, 2205);
}

TEST_F(SourceEndsTest, SilenceThatFillsAGapNeverReachesACaptureClient) {
  auto client = game();
  client.start({.capture = true});
  sendFrame(now());
  ASSERT_TRUE(play(now()));
  device_.clock.advanceSeconds(3);
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{101})});
  ASSERT_TRUE(play(now()));
  int sounds = 0;
  while (client.object().callCount() > 0) {
    const auto call = client.object().takeCall();
    if (call.member != "captureHandlerWithAudioSample") continue;
    platform::SampleTimingInfo timing;
    ASSERT_GE(call.arguments[4].asData().size(), sizeof timing);
    std::memcpy(&timing, call.arguments[4].asData().data(), sizeof timing);
    EXPECT_GT(timing.presentationTimeStamp, platform::MediaTime::zero());
    ++sounds;
  }
  EXPECT_EQ(sounds, 2);
  // After a jump of the wall clock there is none: nobody is given the lack of it.
  device_.clock.setNow({2e9});
  client.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{100})});
  ASSERT_TRUE(play(now()));
  EXPECT_EQ(client.object().callCount(), 1u);
}

}  // namespace
}  // namespace qv
