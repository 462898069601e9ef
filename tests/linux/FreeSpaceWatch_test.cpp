#include "platform/linux/FreeSpaceWatch.h"

#include <gtest/gtest.h>

#include "tests/fakes/ManualExecutor.h"
#include "tests/fakes/ManualTimers.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;

class FreeSpaceWatchTest : public testing::Test {
 protected:
  struct Request {
    int64_t amount;
    int32_t urgency;
    bool operator==(const Request&) const = default;
  };
  void registerService() {
    watch_.registerCallbacks("cache", {.purgeable = {},
                                       .purge =
                                           [this](int64_t amount, int32_t urgency) {
                                             requests_.push_back({amount, urgency});
                                             return int64_t{0};
                                           },
                                       .cancel = {},
                                       .periodic = [this](int64_t, int32_t) { return int64_t{++periodic_}; }});
  }
  std::vector<Request> after(std::chrono::nanoseconds time) {
    // In steps, since a timer is set anew by work of the executor.
    for (; time.count() > 0; time -= 500ms) {
      timers_.advance(500ms);
      executor_.runUntilIdle();
    }
    return std::exchange(requests_, {});
  }

  fakes::ManualTimers timers_;
  fakes::ManualExecutor executor_;
  uint64_t free_ = 10'000'000'000;
  int looks_ = 0, periodic_ = 0;
  std::vector<Request> requests_;
  FreeSpaceWatch watch_{timers_, executor_, FreeSpaceLimits{{100'000'000, 50'000'000, 16'000'000}, 5s}, [this] {
                          ++looks_;
                          return std::optional(free_);
                        }};
};

TEST_F(FreeSpaceWatchTest, AsksOnceForEachRangeIntoWhichTheSpaceFalls) {
  registerService();
  watch_.setActive(true);
  EXPECT_EQ(after(10min), std::vector<Request>{});
  EXPECT_LE(looks_, 12) << "with room the disk is looked at once a minute";
  free_ = 90'000'000;
  EXPECT_EQ(after(60s), (std::vector<Request>{{10'000'000, 1}}));
  free_ = 60'000'000;
  EXPECT_EQ(after(60s), std::vector<Request>{});
  free_ = 1'000'000;
  EXPECT_EQ(after(2s), (std::vector<Request>{{49'000'000, 2}})) << "near the end it is looked at often";
  EXPECT_EQ(after(2s), std::vector<Request>{}) << "a recording may be about to end by itself";
  EXPECT_EQ(after(5s), (std::vector<Request>{{15'000'000, 3}}));
  EXPECT_EQ(after(60s), std::vector<Request>{});
  free_ = 200'000'000;
  EXPECT_EQ(after(60s), std::vector<Request>{});
  free_ = 40'000'000;
  EXPECT_EQ(after(60s), (std::vector<Request>{{10'000'000, 2}}));
  watch_.setActive(false);
  free_ = 0;
  looks_ = 0;
  EXPECT_EQ(after(1h), std::vector<Request>{});
  EXPECT_EQ(looks_, 0) << "nothing wakes an idle daemon";
  watch_.setActive(true);
  EXPECT_EQ(after(7s), (std::vector<Request>{{50'000'000, 2}, {16'000'000, 3}}));
}

TEST_F(FreeSpaceWatchTest, OnceADayOldFilesGoAndTheLatestRegistrationCounts) {
  registerService();
  timers_.advance(23h);
  EXPECT_EQ(executor_.pending(), 0u);
  registerService();
  timers_.advance(24h);
  executor_.runUntilIdle();
  EXPECT_EQ(periodic_, 1);
  free_ = 20'000'000;
  timers_.advance(24h);
  executor_.runUntilIdle();
  EXPECT_EQ(periodic_, 2);
  EXPECT_EQ(requests_, (std::vector<Request>{{30'000'000, 2}}));
  EXPECT_EQ(timers_.pending(), 1u);
}

}  // namespace
}  // namespace qv::platform
