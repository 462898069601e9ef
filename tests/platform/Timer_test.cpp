#include "platform/threads/Timer.h"

#include <gtest/gtest.h>

#include <future>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/threads/Log.h"
#include "tests/fakes/LogRecorder.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;

TEST(TimerTest, CallsInOrderAndNotAfterCancelling) {
  std::promise<void> gate;
  std::promise<void> last;
  std::vector<int> order;  // the timer thread's until `last`
  // While one call waits, everything below is set up, however long that takes.
  const auto blocker = systemTimers().after(0ms, [&] { gate.get_future().get(); });
  const auto first = systemTimers().after(0ms, [&] { order.push_back(1); });
  auto cancelled = systemTimers().after(0ms, [&] { order.push_back(0); });
  const auto second = systemTimers().after(0ms, [&] { order.push_back(2); });
  const auto third = systemTimers().after(1ms, [&] { last.set_value(); });
  cancelled.reset();
  gate.set_value();
  last.get_future().get();
  EXPECT_EQ(order, (std::vector{1, 2}));
}

TEST(TimerTest, ARepeatingTimerMayCancelItself) {
  std::promise<int> third;
  std::unique_ptr<TimerHandle> handle;
  std::mutex mutex;
  int calls = 0;
  {
    std::lock_guard lock(mutex);
    handle = systemTimers().every(1ms, [&] {
      std::lock_guard held(mutex);
      if (++calls < 3) return;
      handle.reset();
      third.set_value(calls);
    });
  }
  EXPECT_EQ(third.get_future().get(), 3);
  std::lock_guard lock(mutex);
  EXPECT_EQ(calls, 3);
}

TEST(LogTest, LevelsFilterAndTheSinkSeesWhatIsLogged) {
  fakes::LogRecorder log;
  setLogLevel(LogLevel::Notice);
  QV_LOG_DEBUG(logs::kPlatform, "unseen");
  QV_LOG(logs::kSupport, "number %d", 7);
  QV_CONSOLE(logs::kSupport, "console");
  std::thread([] { QV_LOG_ERROR(logs::kPlatform, "%s", std::string(5000, 'x').c_str()); }).join();
  const auto lines = log.lines();
  ASSERT_EQ(lines.size(), 3u);
  EXPECT_EQ(lines[0].text, "number 7");
  EXPECT_STREQ(lines[0].category, logs::kSupport);
  EXPECT_EQ(lines[1].channel, LogChannel::Console);
  EXPECT_EQ(lines[2].level, LogLevel::Error);
  EXPECT_EQ(lines[2].text.size(), 1023u) << "long lines are cut";
}

}  // namespace
}  // namespace qv::platform
