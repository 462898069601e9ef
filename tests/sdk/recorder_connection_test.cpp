#include <future>
#include <thread>

#include "platform/threads/Executor.h"
#include "tests/sdk/RecorderFixture.h"

namespace qv::client {
namespace {

class RecorderConnection : public RecorderFixture {};

TEST_F(RecorderConnection, NothingConnectsBeforeTheFirstRequest) {
  run();
  EXPECT_FALSE(daemonEnd_);
  recorder_->pause();
  recorder_->pause();
  EXPECT_EQ(takeLog(), Log{"connected"});
}

TEST_F(RecorderConnection, WithoutADaemonRequestsFailAtOnceAndLaterOnesConnect) {
  killDaemon();
  recorder_->start({}, startHandler());
  recorder_->pause(failure());
  EXPECT_EQ(takeLog(), (Log{"start -5814", "failed -5814"}));
  startDaemon();
  recorder_->stop(stopHandler());
  takeCall().reply({"", Dictionary()});
  EXPECT_EQ(takeLog(), (Log{"connected", "stop ok "}));
}

TEST_F(RecorderConnection, ALossEndsRequestsAndTheRecordingOnce) {
  startRecording();
  takeLog();
  recorder_->currentState([this](const quorvel::StateResult& r) { note("state " + std::to_string(r.error->code)); });
  killDaemon();
  EXPECT_EQ(takeLog(), (Log{"state -5815", "stopped -5815 ", "interrupted"}));
  EXPECT_EQ(timers_.untilNext(), std::nullopt) << "nobody asked to keep connected";
  recorder_->pause(failure());
  EXPECT_EQ(takeLog(), Log{"failed -5814"});
}

TEST_F(RecorderConnection, AnOutstandingStopAloneTellsTheEndOfItsRecording) {
  startRecording();
  takeLog();
  recorder_->stop(stopHandler());
  killDaemon();
  EXPECT_EQ(takeLog(), (Log{"stop -5815 ", "interrupted"}));
}

TEST_F(RecorderConnection, TheWordOfAReplacedRecordingDoesNotEndTheNewOne) {
  const auto interrupted = platform::encodeError(platform::Error{quorvel::kErrorDomain, -5806, {}});
  startRecording();
  startRecording();
  tellClient("stopRecordingWithError", {interrupted, ""});
  EXPECT_EQ(takeLog(), (Log{"connected", "start ok", "start ok"}));
  tellClient("stopRecordingWithError", {interrupted, ""});
  EXPECT_EQ(takeLog(), Log{"stopped -5806 "});
  killDaemon();
  EXPECT_EQ(takeLog(), Log{"interrupted"});
}

TEST_F(RecorderConnection, ANewConnectionLearnsTheActivation) {
  recorder_->didBecomeActive(failure());
  takeCall();
  killDaemon();
  startDaemon();
  recorder_->pause();
  run();
  EXPECT_EQ(daemon_->takeCall().member, "clientDidBecomeActive");
  EXPECT_EQ(daemon_->takeCall().member, "pauseRecording");
}

TEST_F(RecorderConnection, KeptConnectedItLooksForTheDaemonLessAndLessOften) {
  recorder_->keepConnected(true);
  EXPECT_EQ(takeLog(), Log{"connected"});
  killDaemon();
  EXPECT_EQ(takeLog(), Log{"interrupted"});
  for (const auto wait : {250ms, 500ms, 1000ms, 2000ms, 4000ms, 8000ms, 16000ms, 30000ms, 30000ms}) {
    ASSERT_EQ(timers_.untilNext(), wait);
    timers_.advance(wait);
    run();
  }
  startDaemon();
  timers_.advance(30s);
  EXPECT_EQ(takeLog(), Log{"connected"});
  EXPECT_EQ(timers_.untilNext(), std::nullopt);
  // After an answer a loss is looked after soon again.
  recorder_->discard({});
  takeCall().reply({});
  killDaemon();
  EXPECT_EQ(timers_.untilNext(), 250ms);
  recorder_->keepConnected(false);
  run();
  EXPECT_EQ(timers_.untilNext(), std::nullopt);
}

TEST_F(RecorderConnection, DestroyingItEndsTheConnectionWithoutAWord) {
  recorder_->stop(stopHandler());
  takeLog();
  daemonEnd_->setInvalidationHandler([this] { note("the daemon's end"); });
  recorder_.reset();
  EXPECT_EQ(takeLog(), Log{"the daemon's end"});
}

TEST_F(RecorderConnection, DaemonMessagesReachTheirEvents) {
  recorder_->didBecomeActive();
  run();
  takeLog();
  tellClient("updateScreenRecordingState", {true});
  tellClient("updateBroadcastURL", {"https://live"});
  tellClient("updateBroadcastServiceInfo", {Dictionary{{"viewers", int32_t{12}}}});
  tellClient("recordingLockInterrupted", {platform::encodeError(platform::Error{quorvel::kErrorDomain, -5809, {}})});
  tellClient("recordingTimerDidUpdate", {"0:12"});
  tellClient("stopRecordingWithError", {Value(), "file:///m.mp4"});
  EXPECT_EQ(takeLog(), (Log{"state on", "url https://live", "lock RECORDING_ERROR_SYSTEM_DORMANCY", "timer 0:12",
                            "stopped ok file:///m.mp4"}));
  EXPECT_EQ(std::get<int64_t>(serviceInfo_["viewers"].content), 12);
}

TEST_F(RecorderConnection, TheApplicationsExecutorGetsEveryCallback) {
  std::vector<std::function<void()>> queued;
  quorvel::RecorderOptions options;
  options.events.connected = [this] { note("connected"); };
  options.executor = [&](std::function<void()> work) { queued.push_back(std::move(work)); };
  RecorderClient recorder(ipc_, timers_, executor_, std::move(options));
  recorder.stop(stopHandler());
  takeCall().reply({"", Dictionary()});
  EXPECT_EQ(takeLog(), Log{});
  for (const auto& work : queued) work();
  EXPECT_EQ(takeLog(), (Log{"connected", "stop ok "}));
}

/// On real threads, without a daemon.
std::unique_ptr<RecorderClient> onThreads() {
  return std::make_unique<RecorderClient>(std::make_shared<fakes::FakeIPCService>(platform::globalQueue()),
                                          platform::systemTimers(), platform::globalQueue(),
                                          quorvel::RecorderOptions{});
}

/// The destructor waits for the handler that runs, and none runs afterwards.
TEST(RecorderDestruction, WaitsForTheRunningHandler) {
  std::promise<void> entered, release;
  std::atomic<bool> done = false;
  auto destroyed = std::make_shared<std::atomic<bool>>(false);
  auto recorder = onThreads();
  recorder->stop([&](const quorvel::StopResult&) {
    entered.set_value();
    release.get_future().wait();
    done = true;
  });
  entered.get_future().wait();
  recorder->stop([destroyed](const quorvel::StopResult&) { EXPECT_FALSE(*destroyed); });
  std::thread releaser([&] { release.set_value(); });
  recorder.reset();
  *destroyed = true;
  EXPECT_TRUE(done);
  releaser.join();
}

TEST(RecorderDestruction, MayHappenInAHandler) {
  std::promise<void> done;
  auto recorder = onThreads();
  recorder->stop([&](const quorvel::StopResult&) {
    recorder.reset();
    done.set_value();
  });
  done.get_future().wait();
}

}  // namespace
}  // namespace qv::client
