#include "platform/threads/EventLoop.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/epoll.h>

#include <array>
#include <future>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "tests/kit/Events.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;

/// A descriptor that can be read from the beginning.
struct ReadablePipe {
  ReadablePipe() {
    std::array<int, 2> fds{};
    EXPECT_EQ(::pipe2(fds.data(), O_CLOEXEC), 0);
    reading.reset(fds[0]);
    writing.reset(fds[1]);
    EXPECT_EQ(::write(writing.get(), "x", 1), 1);
  }
  FileDescriptor reading, writing;
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
  const ReadablePipe pipes[2];
  EventLoop loop;
  EventLoop::Watch watches[2];
  int calls = 0;
  run(loop, [&] {
    for (int i = 0; i < 2; ++i) {
      watches[i] = loop.watch(pipes[i].reading.get(), EPOLLIN, [&](uint32_t) {
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
  const ReadablePipe first, second;
  const int number = first.reading.get();
  std::array<char, 1> byte{};
  EXPECT_EQ(::read(number, byte.data(), 1), 1);
  auto former = loop.watch(number, EPOLLIN, [&](uint32_t) { heard.add("former"); });
  ASSERT_EQ(::dup2(second.reading.get(), number), number);  // closes it, as a library does by itself
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
    const ReadablePipe pipe;
    kit::Events<bool> released;
    std::shared_ptr<void> held(nullptr, [&released](void*) { released.add(true); });
    const auto watch = loop->watch(pipe.writing.get(), 0, [held](uint32_t) {});
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
