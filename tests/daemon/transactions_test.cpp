#include <cmath>
#include <utility>

#include "daemon/DeviceSleep.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

/// A monitor that says who observes it.
struct FakeLayoutMonitor final : platform::DisplayLayoutMonitor {
  void addObserver(std::weak_ptr<platform::DisplayLayoutObserver> to) override { observer = std::move(to); }
  void removeObserver(const platform::DisplayLayoutObserver*) override { observer.reset(); }
  void invalidate() override { isInvalid = true; }
  [[nodiscard]] bool isObserved() const { return !observer.expired(); }
  std::weak_ptr<platform::DisplayLayoutObserver> observer;
  bool isInvalid = false;
};

/// Whether a recording starts, and every way in which it ends.
class TransactionsTest : public QuietDaemonTest {
 protected:
  TransactionsTest() { manager_->setLayoutMonitor(monitor_); }

  struct Case {
    std::string name;
    std::function<void(TransactionsTest&, TestClient&)> run;
  };
  void showLayout(const std::vector<int64_t>& levels) { showLayout(levels, monitor_->observer.lock()); }
  void showLayout(const std::vector<int64_t>& levels, const std::shared_ptr<platform::DisplayLayoutObserver>& to) {
    platform::DisplayLayout layout;
    for (const int64_t level : levels) layout.elements.push_back({"e", level});
    if (to) to->layoutMonitorDidUpdateDisplayLayout(*monitor_, layout);
    device_.run();
  }
  static const std::vector<Case>& ends();

  const std::shared_ptr<FakeLayoutMonitor> monitor_ = std::make_shared<FakeLayoutMonitor>();
};

const std::vector<TransactionsTest::Case>& TransactionsTest::ends() {
  const auto ask = [](std::vector<const char*> members) {
    return [members](auto&, TestClient& client) {
      for (const char* member : members) client.request(member);
    };
  };
  constexpr auto kStop = "stopRecordingWithHandler", kDiscard = "discardRecordingWithHandler";
  static const std::vector<Case> cases{
      {"stop", ask({kStop})},
      {"two stops", ask({kStop, kStop})},
      {"stop in a pause", ask({"pauseRecording", kStop})},
      {"discard after a stop", ask({kDiscard, kStop, kDiscard})},
      {"stop with clips",
       [](auto&, TestClient& client) {
         client.request("stopRecordingWithStartClipDuration", {Value(1.0), Value(1.0)});
       }},
      {"a resume with another's window",
       [](auto&, TestClient& client) {
         client.request("pauseRecording");
         client.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{77})});
       }},
      {"disconnection", [](auto&, TestClient& client) { client.disconnect(); }},
      {"another start",
       [](TransactionsTest& t, TestClient&) {
         auto other = t.chat();
         other.start();
         EXPECT_EQ(t.openTransactions(), 1);
         other.stop();
       }},
      {"a start of its own",
       [](TransactionsTest& t, TestClient& client) {
         client.start();
         EXPECT_EQ(t.openTransactions(), 1);
         client.stop();
       }},
      {"preemption and stop",
       [](TransactionsTest& t, TestClient& client) {
         auto& controller = t.device_.screen.last();
         controller.delegate.lock()->screenCaptureControllerWasPreempted(controller);
         client.stop();
       }},
      {"purge", [](TransactionsTest& t, TestClient&) { t.device_.purgeableSpace.callbacks.purge(1, 3); }},
      {"layout",
       [](TransactionsTest& t, TestClient&) {
         t.showLayout({0, 0});
         t.showLayout({0, 0});
       }},
      {"shutdown", [](TransactionsTest& t, TestClient&) { t.manager_->shutDown([] {}); }},
  };
  return cases;
}

TEST_F(TransactionsTest, AStartIsRefusedByItsFirstFailingCheckAndLeavesNoneOpen) {
  auto client = game();
  const auto codeOf = [&](const TestClient::StartOptions& options) {
    const int64_t code = client.start(options)->code();
    EXPECT_EQ(openTransactions(), code == 0 ? 1 : 0);
    EXPECT_EQ(monitor_->isObserved(), code == 0);
    return code;
  };
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
  device_.applications.states["com.example.game"] = platform::kApplicationForeground;
  EXPECT_EQ(codeOf({.contexts = {7}}), 0);
  EXPECT_EQ(device_.screen.contexts, std::set<uint32_t>{7});
}

TEST_F(TransactionsTest, EveryEndOfARecordingClosesItsOwn) {
  for (const bool capture : {false, true}) {
    for (const bool hasFrame : {true, false}) {
      for (const Case& end : ends()) {
        const std::string name = end.name + (capture ? " of a capture" : "") + (hasFrame ? "" : " without a frame");
        auto client = game();
        const int begun = device_.keepAlive.begun;
        EXPECT_EQ(client.start({.capture = capture})->code(), 0) << name;
        EXPECT_EQ(openTransactions(), 1) << name;
        EXPECT_TRUE(monitor_->isObserved()) << name;
        if (hasFrame) sendFrame(kSecond);
        end.run(*this, client);
        device_.run();
        EXPECT_EQ(openTransactions(), 0) << name;
        EXPECT_FALSE(monitor_->isObserved()) << name;
        EXPECT_GT(device_.keepAlive.begun, begun);
      }
    }
  }
}

TEST_F(TransactionsTest, ADividedDisplayEndsAnApplicationsRecordingWithItsMovie) {
  auto client = game();
  record(client);
  showLayout({0});
  showLayout({0, 2});  // what is above applications does not divide the display
  showLayout({0});
  showLayout({0, 0, 5});  // two ordinary ones and one above: counted, nothing ends
  EXPECT_TRUE(client.isRecording());
  showLayout({0});
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kContentResize});
  EXPECT_EQ(save(client, client.lastMovie()), 0);
  record(client);
  showLayout({0, 1});
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kContentResize});
  client.start();
  showLayout({0});
  EXPECT_TRUE(client.isRecording()) << "a division before it began is not its own";
  client.request("clientDidBecomeActive");
  EXPECT_TRUE(client.takeEnds().empty()) << "only an interruption is told again";

  auto late = monitor_->observer.lock();
  auto system = systemUI();
  system.start({.system = true});
  showLayout({0, 0}, std::exchange(late, nullptr));
  EXPECT_TRUE(system.isRecording());
  client.disconnect();
  system.disconnect();
  manager_.reset();
  device_.run();
  EXPECT_TRUE(monitor_->isInvalid);
}

TEST_F(TransactionsTest, ALongSleepEndsASystemRecordingAShortOneDoesNot) {
  const auto handlers = handlersOfDeviceSleep(manager_);
  auto system = systemUI();
  system.start({.width = 1920, .height = 1080, .system = true});
  EXPECT_FALSE(monitor_->isObserved()) << "the whole screen may be divided as it likes";
  sendFrame(kSecond);
  const auto sleep = [&](std::chrono::seconds time) {
    auto hold = std::make_shared<int>();
    const std::weak_ptr<int> held = hold;
    handlers.willSleep(std::move(hold));
    EXPECT_EQ(held.expired(), !manager_) << "the device waits for the manager";
    device_.run();
    EXPECT_TRUE(held.expired());
    handlers.didWake(time);
    device_.run();
  };
  sleep(kLongestSleepOfRecording);
  EXPECT_TRUE(system.isRecording());
  sendFrame(2 * kSecond);
  sleep(std::chrono::hours(8));
  EXPECT_FALSE(system.isRecording());
  EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(device_.photoLibrary.stored.size(), 1u);
  EXPECT_EQ(device_.movies.last().sessionEnd, platform::MediaTime::make(2, 1)) << "with what came after a short sleep";
  EXPECT_EQ(openTransactions(), 0);
  system.disconnect();
  manager_.reset();
  sleep(std::chrono::hours(8));
}

}  // namespace
}  // namespace qv
