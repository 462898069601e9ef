#include "platform/threads/CallbackGate.h"

#include <gtest/gtest.h>

#include <atomic>
#include <future>

namespace qv::platform {
namespace {

TEST(CallbackGateTest, WhoeverClosesItWaitsForTheCallOfAnotherThread) {
  CallbackGate gate;
  std::promise<void> began, released;
  std::atomic<bool> hasEnded = false;
  auto caller = std::async(std::launch::async, [&] {
    return gate.enter([&] {
      began.set_value();
      released.get_future().get();
      hasEnded = true;
    });
  });
  began.get_future().get();
  auto closer = std::async(std::launch::async, [&] {
    gate.close();
    return hasEnded.load();
  });
  // Refused only once it is closed; till then it waits for its turn.
  EXPECT_FALSE(gate.enter([] { ADD_FAILURE() << "two calls at once"; }));
  released.set_value();
  EXPECT_TRUE(closer.get());
  EXPECT_FALSE(caller.get()) << "it was closed meanwhile";
}

TEST(CallbackGateTest, ACallMayCloseItAndBeginAnotherTime) {
  CallbackGate gate;
  const auto first = gate.open();
  CallbackGate::Time second = 0;
  int calls = 0;
  EXPECT_FALSE(gate.enter(first, [&] {
    gate.close(first);
    EXPECT_FALSE(gate.enter([&] { ++calls; }));
    second = gate.open();
    gate.close(first);
    EXPECT_TRUE(gate.enter(second, [&] { ++calls; })) << "within a call of its own thread";
  }));
  EXPECT_FALSE(gate.enter(first, [&] { ++calls; }));
  EXPECT_TRUE(gate.enter([&] { ++calls; }));
  EXPECT_EQ(calls, 2);
}

}  // namespace
}  // namespace qv::platform
