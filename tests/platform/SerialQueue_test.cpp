#include "platform/threads/SerialQueue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <memory>
#include <thread>
#include <vector>

#include "tests/fakes/ManualExecutor.h"

namespace qv::platform {
namespace {

TEST(SerialQueueTest, ItemsOfManyThreadsRunOneAtATimeAndInOrder) {
  constexpr int kThreads = 4;
  constexpr int kItems = 2000;
  SerialQueue queue("test");
  SerialQueue child("child", queue);
  std::vector<int> last(kThreads, -1);  // unguarded: the queue is the guard
  int outOfOrder = 0;
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      for (int item = 0; item < kItems; ++item) {
        const auto work = [&, thread, item] {
          if (last[static_cast<size_t>(thread)] != item - 1) ++outOfOrder;
          last[static_cast<size_t>(thread)] = item;
        };
        if (item % 100 == 0) {
          queue.sync(work);
        } else if (item % 2 == 0) {
          child.async(work);
        } else {
          queue.async(work);
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  queue.sync([&] {
    EXPECT_EQ(outOfOrder, 0);
    EXPECT_EQ(last, std::vector<int>(kThreads, kItems - 1));
  });
}

TEST(SerialQueueTest, KnowsWhereItRuns) {
  fakes::ManualExecutor executor;
  SerialQueue target("target", executor);
  SerialQueue queue("queue", target);
  SerialQueue other("other", executor);
  int checks = 0;
  queue.async([&] {
    EXPECT_TRUE(queue.isOnQueue());
    EXPECT_TRUE(target.isOnQueue());
    EXPECT_FALSE(other.isOnQueue());
    other.sync([&] { EXPECT_TRUE(queue.isOnQueue() && other.isOnQueue()); });
    ++checks;
  });
  target.async([&] {
    EXPECT_FALSE(queue.isOnQueue());
    ++checks;
  });
  executor.runUntilIdle();
  EXPECT_EQ(checks, 2);
  EXPECT_FALSE(target.isOnQueue());
  EXPECT_EQ(queue.syncResult<int>([] { return 7; }), 7);
}

TEST(SerialQueueTest, WorkOfADeadOwnerIsDroppedAndQueuedWorkOutlivesTheQueue) {
  fakes::ManualExecutor executor;
  int runs = 0;
  {
    SerialQueue queue("queue", executor);
    auto owner = std::make_shared<int>(1);
    auto survivor = std::make_shared<int>(2);
    queue.async(std::weak_ptr(owner), [&](int&) { runs += 100; });
    queue.async([&runs, survivor] { runs += *survivor; });
    owner.reset();
  }
  executor.runUntilIdle();
  EXPECT_EQ(runs, 2);
}

TEST(SerialQueueDeathTest, WaitingForItselfAborts) {
  testing::FLAGS_gtest_death_test_style = "threadsafe";
  fakes::ManualExecutor executor;
  SerialQueue queue("mine", executor);
  EXPECT_DEATH(queue.sync([&] { queue.sync([] {}); }), "sync on queue mine");
  EXPECT_DEATH(queue.assertOnQueue(), "not on queue mine");
}

TEST(ExecutorTest, WorkThatWaitsForOtherWorkDoesNotStopIt) {
  constexpr int kWaiters = 16;
  std::promise<void> gate;
  const std::shared_future<void> opened = gate.get_future().share();
  std::vector<std::future<void>> done;
  for (int i = 0; i < kWaiters; ++i) {
    auto finished = std::make_shared<std::promise<void>>();
    done.push_back(finished->get_future());
    globalQueue().post([opened, finished] {
      opened.wait();
      finished->set_value();
    });
  }
  globalQueue().post([&gate] { gate.set_value(); });
  for (auto& future : done) future.get();
}

TEST(ExecutorTest, AThreadWithoutWorkEndsAndLaterWorkIsDone) {
  struct EndOfThread {
    std::promise<void> promise;
    ~EndOfThread() { promise.set_value(); }
  };
  std::promise<std::future<void>> posted;
  globalBackgroundQueue().post([&posted] {
    thread_local EndOfThread end;
    posted.set_value(end.promise.get_future());
  });
  posted.get_future().get().get();
  std::promise<void> later;
  globalBackgroundQueue().post([&later] { later.set_value(); });
  later.get_future().get();
}

}  // namespace
}  // namespace qv::platform
