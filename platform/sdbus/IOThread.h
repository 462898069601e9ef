#pragma once

#include <chrono>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <thread>

#include "platform/base/FileDescriptor.h"

namespace qv::platform::sdbus {

/// The one thread that reads and writes: it waits for descriptors, due times and posted work, and
/// sleeps without wake-ups while there is none. It starts with the first work posted.
///
/// Threading: `post` and `stop` from any thread; everything else on the I/O thread.
class IOThread {
 public:
  using EventHandler = std::function<void(uint32_t epollEvents)>;
  using Token = uint64_t;

  IOThread();
  ~IOThread();
  IOThread(const IOThread&) = delete;
  IOThread& operator=(const IOThread&) = delete;

  /// Runs `work` on the thread; after `stop` it is dropped.
  void post(std::function<void()> work);
  /// Runs what was posted before, then ends the thread. Not to be called on it.
  void stop();

  Token watch(int fd, uint32_t epollEvents, EventHandler handler);
  void modify(Token token, int fd, uint32_t epollEvents);
  /// Before the descriptor is closed; with -1 where it is closed already, which ends the watch too.
  void unwatch(Token token, int fd);
  Token after(std::chrono::milliseconds delay, std::function<void()> work);
  void cancel(Token timer);

 private:
  using Time = std::chrono::steady_clock::time_point;
  struct Timer {
    Token token;
    std::function<void()> work;
  };

  void run();
  void runPosted();
  void runTimers();
  [[nodiscard]] int timeoutInMilliseconds() const;
  void wake();

  FileDescriptor epoll_;
  FileDescriptor event_;
  std::mutex mutex_;
  std::deque<std::function<void()>> posted_;
  bool stopping_ = false;
  std::thread thread_;
  // I/O thread only:
  bool quit_ = false;
  Token nextToken_ = 1;  // 0 is the eventfd
  std::map<Token, std::shared_ptr<EventHandler>> watches_;
  std::multimap<Time, Timer> timers_;
};

}  // namespace qv::platform::sdbus
