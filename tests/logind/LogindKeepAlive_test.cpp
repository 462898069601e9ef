#include "platform/logind/LogindKeepAlive.h"

#include <algorithm>
#include <set>

#include "tests/fakes/LogRecorder.h"
#include "tests/logind/FakeLogind.h"

namespace qv::platform::test {
namespace {

class LogindKeepAliveTest : public ::testing::Test {
 protected:
  std::set<std::string> nextTwo() {
    std::set<std::string> events{logind_.events.next()};
    events.insert(logind_.events.next());
    return events;
  }
  const std::set<std::string> taken_{"idle block", "sleep delay"}, released_{"idle released", "sleep released"};
  PrivateBus bus_;
  FakeLogind logind_{bus_.address()};
  kit::Events<bool> activity_;
  LogindKeepAlive keepAlive_{
      {.busAddress = bus_.address(), .activityHandler = [this](bool isOpen) { activity_.add(isOpen); }}};
};

TEST_F(LogindKeepAliveTest, InhibitorsAreHeldFromTheFirstTransactionToTheLast) {
  for (int time = 0; time < 2; ++time) {
    keepAlive_.beginTransaction();
    EXPECT_EQ(nextTwo(), taken_);
    keepAlive_.beginTransaction();
    keepAlive_.endTransaction();
    EXPECT_EQ(keepAlive_.openTransactionCount(), 1);
    EXPECT_TRUE(logind_.events.isEmpty());
    keepAlive_.endTransaction();
    EXPECT_EQ(nextTwo(), released_);
    EXPECT_TRUE(activity_.next());
    EXPECT_FALSE(activity_.next());
  }
  EXPECT_TRUE(activity_.isEmpty());
}

TEST_F(LogindKeepAliveTest, SleepWaitsUntilTheHoldIsLetGoOf) {
  kit::Events<std::shared_ptr<void>> holds;
  kit::Events<std::chrono::nanoseconds> wakes;
  keepAlive_.setHandlers({.willSleep = [&](std::shared_ptr<void> hold) { holds.add(std::move(hold)); },
                          .didWake = [&](std::chrono::nanoseconds asleep) { wakes.add(asleep); }});
  keepAlive_.beginTransaction();
  EXPECT_EQ(nextTwo(), taken_);
  for (int time = 0; time < 2; ++time) {
    logind_.announceSleep(true);
    auto hold = holds.next();
    EXPECT_TRUE(logind_.events.isEmpty());
    hold.reset();
    EXPECT_EQ(logind_.events.next(), "sleep released");
    logind_.announceSleep(false);
    EXPECT_LT(wakes.next(), std::chrono::seconds(1)) << "this machine did not sleep";
    EXPECT_EQ(logind_.events.next(), "sleep delay");
  }
  keepAlive_.endTransaction();
  EXPECT_EQ(nextTwo(), released_);
}

TEST(LogindKeepAliveWithoutLogindTest, CountsAllTheSameAndTellsNoError) {
  fakes::LogRecorder log;
  PrivateBus bus;
  for (const std::string& address : {std::string("unix:path=/nonexistent/bus"), bus.address()}) {
    LogindKeepAlive keepAlive({.busAddress = address, .activityHandler = {}});
    keepAlive.beginTransaction();
    keepAlive.beginTransaction();
    keepAlive.endTransaction();
    EXPECT_EQ(keepAlive.openTransactionCount(), 1);
    keepAlive.endTransaction();
    EXPECT_EQ(keepAlive.openTransactionCount(), 0);
  }
  const auto errors = [&log] {
    const auto lines = log.lines();
    return std::count_if(lines.begin(), lines.end(), [](const auto& line) { return line.level == LogLevel::Error; });
  };
  EXPECT_EQ(errors(), 0);
  LogindKeepAlive keepAlive;
  keepAlive.endTransaction();
  EXPECT_EQ(keepAlive.openTransactionCount(), 0);
  EXPECT_EQ(errors(), 1) << "an end too many";
}

}  // namespace
}  // namespace qv::platform::test
