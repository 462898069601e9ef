#include "platform/sdbus/Outbox.h"

#include <gtest/gtest.h>

#include "platform/sdbus/Backlog.h"

namespace qv::platform::sdbus {
namespace {

SdBusIPCOptions smallBounds() {
  SdBusIPCOptions options;
  options.maximumQueuedMediaBytes = 1000;
  options.maximumQueuedBytes = 4000;
  options.maximumFramesInFlight = 2;
  options.maximumMediaCallsInFlight = 1;
  options.maximumUnhandledMessages = 1;
  return options;
}

class OutboxTest : public ::testing::Test {
 protected:
  bool pushMedia(size_t bytes) {
    return outbox_.admitMedia({bytes, 0}, false) && outbox_.push(OutgoingCall{0, {}, &media_, {}, false}, {bytes, 0});
  }
  bool pushControl(size_t bytes) { return outbox_.push(OutgoingAnswer{}, {bytes, 0}); }
  const IPCOperation media_{"sample", {}, {}, std::nullopt, {}, true};
  Outbox outbox_{smallBounds()};
};

/// Each message costs 256 bytes besides.
TEST_F(OutboxTest, MediaIsDroppedUntilTheKernelHasWhatWaits) {
  EXPECT_FALSE(outbox_.nextHasDescriptors());
  EXPECT_TRUE(pushMedia(2000)) << "nothing else waits";
  EXPECT_FALSE(pushMedia(1));
  EXPECT_TRUE(pushControl(4000 - 256 - 2256)) << "the bound of all";
  EXPECT_FALSE(pushControl(0));
  EXPECT_TRUE(outbox_.next());
  EXPECT_FALSE(pushMedia(1)) << "sd-bus may still have it";
  EXPECT_TRUE(outbox_.settle());
  EXPECT_FALSE(outbox_.settle());
  EXPECT_TRUE(pushMedia(600));
  EXPECT_FALSE(pushMedia(1000 - 856 + 1));
  EXPECT_TRUE(pushMedia(1000 - 856));
  EXPECT_TRUE(pushControl(744));
  outbox_.clear();
  EXPECT_FALSE(outbox_.next());
  EXPECT_FALSE(outbox_.settle());
  EXPECT_TRUE(pushMedia(600));
  EXPECT_FALSE(outbox_.nextHasDescriptors());
  EXPECT_TRUE(outbox_.next());
  EXPECT_TRUE(outbox_.push(OutgoingAnswer{}, {1, 1}));
  EXPECT_TRUE(outbox_.nextHasDescriptors());
}

TEST_F(OutboxTest, MediaThatThePeerAnswersIsBoundedUntilItHas) {
  auto first = outbox_.admitMedia({1, 1}, true), second = outbox_.admitMedia({1, 2}, true);
  EXPECT_TRUE(first && second);
  EXPECT_FALSE(outbox_.admitMedia({1, 2}, true));
  auto call = outbox_.admitMedia({1, 0}, true);
  EXPECT_TRUE(call) << "frames have a bound of their own";
  EXPECT_FALSE(outbox_.admitMedia({1, 0}, true));
  EXPECT_TRUE(outbox_.admitMedia({1, 0}, false)) << "it is not answered";
  second->reset();
  EXPECT_TRUE(outbox_.admitMedia({1, 2}, true));
}

TEST(BacklogTest, TheHandlerThatMakesRoomLetsReadingGoOn) {
  Backlog backlog(smallBounds());
  backlog.add(1);
  EXPECT_FALSE(backlog.pausesReading(false));
  backlog.add(1);
  EXPECT_TRUE(backlog.pausesReading(false));
  EXPECT_TRUE(backlog.remove(1));
  EXPECT_FALSE(backlog.pausesReading(false));
  EXPECT_FALSE(backlog.remove(1)) << "it was not paused";
  EXPECT_TRUE(backlog.pausesReading(true));
}

}  // namespace
}  // namespace qv::platform::sdbus
