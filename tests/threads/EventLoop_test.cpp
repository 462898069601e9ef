#include "platform/threads/EventLoop.h"

#include <gtest/gtest.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>

#include <future>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "tests/kit/Events.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;

/// Can be read from the beginning.
struct Readable {
  FileDescriptor fd{::eventfd(1, EFD_CLOEXEC)};
};

void run(EventLoop& loop, const std::function<void()>& work) {
  std::promise<void> done;
  loop.post([&] {
    work();
    done.set_value();
  });
  done.get_future().get();
}

TEST(EventLoopTest, AHandlerMayEndItsOwnWatchAndOthers) {
  const Readable readables[2];
  EventLoop loop;
  EventLoop::Watch watches[2];
  int calls = 0;
  run(loop, [&] {
    for (int i = 0; i < 2; ++i) {
      watches[i] = loop.watch(readables[i].fd.get(), EPOLLIN, [&](uint32_t) {
        ++calls;
        for (auto& watch : watches) watch.end();
      });
    }
  });
  run(loop, [&] { EXPECT_EQ(calls, 1); });
}

TEST(EventLoopTest, TheNumberOfAClosedDescriptorBelongsToTheNextOne) {
  EventLoop loop;
  kit::Events<std::string> heard;
  const Readable first, second;
  const int number = first.fd.get();
  eventfd_t value = 0;
  EXPECT_EQ(::eventfd_read(number, &value), 0);
  auto former = loop.watch(number, EPOLLIN, [&](uint32_t) { heard.add("former"); });
  ASSERT_EQ(::dup2(second.fd.get(), number), number);  // closes it, as a library does by itself
  EventLoop::Watch watch;
  run(loop, [&] {
    watch = loop.watch(number, EPOLLIN, [&](uint32_t) {
      watch.end();
      heard.add("second");
    });
    former.end();
  });
  EXPECT_EQ(heard.next(), "second");
}

TEST(EventLoopTest, TimersComeInTheirOrderAndNotAfterTheirEnd) {
  EventLoop loop;
  kit::Events<int> due;
  EventLoop::Timer timers[3];
  run(loop, [&] {
    timers[0] = loop.after(2ms, [&] { due.add(2); });
    timers[1] = loop.after(0ms, [&] { due.add(0); });
    timers[2] = loop.after(1ms, [&] { due.add(1); });
    timers[1].end();
  });
  EXPECT_EQ(due.next(), 1);
  EXPECT_EQ(due.next(), 2);
}

TEST(EventLoopTest, StoppedOrDestroyedFromWithinItLetsGoOfEverything) {
  for (const bool fromWithin : {false, true}) {
    auto loop = std::make_unique<EventLoop>();
    const Readable readable;
    kit::Events<bool> released;
    std::shared_ptr<void> held(nullptr, [&released](void*) { released.add(true); });
    const auto watch = loop->watch(readable.fd.get(), 0, [held](uint32_t) {});
    const auto timer = loop->after(1h, [held] {});
    held.reset();
    std::promise<void> done;
    loop->post([&] {
      if (fromWithin) loop.reset();
      done.set_value();
    });
    if (!fromWithin) loop.reset();
    done.get_future().get();
    EXPECT_TRUE(released.next());
  }
}

}  // namespace
}  // namespace qv::platform
