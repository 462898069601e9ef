#include "platform/base/SharedFrame.h"

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstring>
#include <future>
#include <memory>

#include "platform/threads/SharedFrameLease.h"

namespace qv::platform {
namespace {

constexpr FrameLayout kLayout{64, 32, 256, PixelFormat::BGRX};

TEST(SharedFrameTest, RefusesSenselessLayouts) {
  for (const FrameLayout& layout :
       {FrameLayout{0, 0, 0}, FrameLayout{64, 0, 256}, FrameLayout{64, 32, 255}, FrameLayout{16385, 1, 65540},
        FrameLayout{0x40000001, 1, 4}, FrameLayout{64, 32, 256, static_cast<PixelFormat>(2)}}) {
    EXPECT_FALSE(SharedFrame::create(layout)) << layout.width << "x" << layout.height << " " << layout.stride;
  }
}

TEST(SharedFrameTest, AnAdoptedFrameSeesTheSendersPixels) {
  const auto frame = SharedFrame::create(kLayout).value();
  std::memset(frame->mutableBytes().data(), 0x5A, kLayout.byteSize());
  auto attachment = std::make_shared<int>();
  const std::weak_ptr<int> watch = attachment;
  auto adopted = SharedFrame::adopt(frame->memory(), kLayout, std::move(attachment));
  ASSERT_TRUE(adopted);
  EXPECT_EQ(adopted.value()->bytes()[kLayout.byteSize() - 1], 0x5A);
  EXPECT_TRUE(adopted.value()->mutableBytes().empty());
  EXPECT_FALSE(watch.expired());
  adopted.value().reset();
  EXPECT_TRUE(watch.expired());
}

TEST(SharedFrameTest, MemoryThatCouldShrinkOrIsTooSmallIsRefused) {
  FileDescriptor unsealed(::memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  ASSERT_EQ(::ftruncate(unsealed.get(), static_cast<off_t>(kLayout.byteSize())), 0);
  EXPECT_FALSE(SharedFrame::adopt(shareFileDescriptor(std::move(unsealed)), kLayout, nullptr));
  const auto frame = SharedFrame::create(kLayout).value();
  FrameLayout taller = kLayout;
  taller.height += 1;
  EXPECT_FALSE(SharedFrame::adopt(frame->memory(), taller, nullptr));
  EXPECT_FALSE(SharedFrame::adopt(nullptr, kLayout, nullptr));
  EXPECT_NE(::ftruncate(frame->memory()->get(), 0), 0);
}

TEST(SharedFramePoolTest, IsBoundedAndReusesWhatCameBack) {
  SharedFramePool pool(2);
  auto first = pool.take(kLayout);
  auto second = pool.take(kLayout);
  ASSERT_TRUE(first && second);
  EXPECT_EQ(pool.take(kLayout), nullptr);
  const int memory = first->memory()->get();
  first.reset();
  first = pool.take(kLayout);
  ASSERT_TRUE(first);
  EXPECT_EQ(first->memory()->get(), memory);
  second.reset();
  const FrameLayout other{32, 32, 128};
  second = pool.take(other);
  ASSERT_TRUE(second);
  EXPECT_EQ(second->layout(), other);
  EXPECT_EQ(pool.take(other), nullptr) << "a frame of the former layout is still out";
}

TEST(SharedFramePoolTest, FramesOutliveTheirPool) {
  auto pool = std::make_unique<SharedFramePool>(1);
  const auto frame = pool->take(kLayout);
  pool.reset();
  frame->mutableBytes()[0] = 1;
  EXPECT_EQ(frame->bytes()[0], 1);
}

TEST(SharedFrameLeaseTest, HoldsTheFrameUntilTheLastCopyIsClosed) {
  std::promise<void> released;
  auto attachment = std::shared_ptr<void>(nullptr, [&](void*) { released.set_value(); });
  const SharedFrameRef pixels = SharedFrame::create(kLayout).value();
  SharedFrameRef frame(std::move(attachment), pixels.get());
  const size_t before = outstandingSharedFrameLeases();
  auto lease = issueSharedFrameLease(std::move(frame));
  ASSERT_TRUE(lease);
  FileDescriptor copy(::dup(lease.value().get()));
  lease.value().reset();
  EXPECT_EQ(outstandingSharedFrameLeases(), before + 1);
  copy.reset();
  released.get_future().get();
}

}  // namespace
}  // namespace qv::platform
