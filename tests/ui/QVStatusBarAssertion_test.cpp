#include "ui/QVStatusBarAssertion.h"

#include "tests/fakes/FakeDevice.h"

namespace qv {
namespace {

using namespace std::chrono_literals;

struct CountingAssertion final : QVStatusBarAssertion {
  using QVStatusBarAssertion::QVStatusBarAssertion;
  void updateStatusStringWithTimer(platform::TimerHandle&) override { ++ticks; }
  int ticks = 0;
};

TEST(QVStatusBarAssertionTest, ASecondStartReplacesTheTimerAndItEndsWithTheObject) {
  fakes::FakeDevice device;
  fakes::ManualTimers timers;
  device.platform.timers = &timers;
  auto assertion = std::make_shared<CountingAssertion>(device.platform, device.texts);
  assertion->startRepeatingTimer();
  EXPECT_EQ(assertion->timerStartDate(), std::nullopt) << "on the main queue, later";
  device.run();
  timers.advance(1000ms);
  device.run();
  EXPECT_EQ(assertion->ticks, 2);
  timers.advance(500ms);  // a tick is on its way
  device.clock.advance(10s);
  assertion->startRepeatingTimer();
  device.run();
  EXPECT_EQ(timers.pending(), 1u);
  EXPECT_EQ(assertion->timerStartDate()->secondsSince1970, fakes::FakeClock::kStart + 10);
  const int before = assertion->ticks;
  timers.advance(500ms);
  device.run();
  EXPECT_EQ(assertion->ticks, before + 1);
  assertion.reset();
  EXPECT_EQ(timers.pending(), 0u);
}

TEST(QVStatusBarAssertionTest, DurationsHaveTwoUnits) {
  const auto text = &QVStatusBarAssertion::stringWithTimeInterval;
  EXPECT_EQ(text(0), "0:00");
  EXPECT_EQ(text(59.5), "0:59");
  EXPECT_EQ(text(65), "1:05");
  EXPECT_EQ(text(3661), "1:01");
  EXPECT_EQ(text(90'000), "25:00");
  EXPECT_EQ(text(-1), "0:00");
  EXPECT_EQ(text(std::nan("")), "0:00");
}

TEST(QVStatusBarAssertionTest, TheTextFollowsTheState) {
  fakes::FakeDevice device;  // without the framework's texts each key stands for its text
  QVStatusBarAssertion assertion(device.platform, device.texts);
  EXPECT_EQ(assertion.qvLocalizedRecordingDuration(1, false), "RECORDING_STATUS_BAR");
  EXPECT_EQ(assertion.qvLocalizedRecordingDuration(1, true), "RECORDING_PAUSED_STATUS_BAR");
  assertion.broadcasting = true;
  EXPECT_EQ(assertion.qvLocalizedRecordingDuration(1, false), "BROADCASTING_STATUS_BAR_FORMAT");
  EXPECT_EQ(assertion.qvLocalizedRecordingDuration(1, true), "BROADCASTING_PAUSED_STATUS_BAR_FORMAT");
}

}  // namespace
}  // namespace qv
