#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

namespace qv::platform {

/// A thread that waits for descriptors, due times and posted work, and sleeps without wake-ups while there is none.
/// It starts with the first of these, so a loop that nobody uses costs two descriptors.
///
/// Handlers run one at a time. They may end their own watch or any other, and destroy the loop.
///
/// Threading: thread-safe. A watch or timer that is ended on the loop's own thread calls nothing any more; ended in
/// another thread, a call in progress is not waited for. The thread has all signals blocked.
class EventLoop {
  struct State;

 public:
  using EventHandler = std::function<void(uint32_t epollEvents)>;
  using Work = std::function<void()>;

  /// A call that is due later; destroying this cancels it. It may outlive the loop.
  ///
  /// Threading: used by one thread at a time.
  class Timer {
   public:
    Timer() = default;
    Timer(Timer&& other) noexcept : loop_(std::move(other.loop_)), token_(std::exchange(other.token_, 0)) {}
    Timer& operator=(Timer&& other) noexcept;
    ~Timer() { end(); }
    void end();
    /// Whether it was made and not ended; a call that has been made counts too.
    explicit operator bool() const { return token_ != 0; }

   protected:
    friend class EventLoop;
    Timer(std::weak_ptr<State> loop, uint64_t token) : loop_(std::move(loop)), token_(token) {}
    std::weak_ptr<State> loop_;
    uint64_t token_ = 0;
  };

  /// A descriptor that is waited for; destroying this ends that. It may outlive the loop.
  ///
  /// Threading: used by one thread at a time.
  class Watch : public Timer {
   public:
    using Timer::Timer;
    /// Which events are waited for; besides, the loss of the other end is always told.
    void setEvents(uint32_t epollEvents);
    /// Ends it where a library has closed the descriptor by itself: the number may be another file's by now, in another
    /// thread.
    void forget();
  };

  EventLoop();
  /// Like `stop`.
  ~EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  /// Runs `work` on the thread; after `stop` it is dropped.
  void post(Work work);
  /// Runs what was posted before, and nothing else any more, ends the thread and lets go of all handlers. On the loop's
  /// own thread that happens once the work in progress has returned; in others it is waited for.
  void stop();

  /// Calls `handler` with what `fd` is ready for, level-triggered. Empty, with a line in the log, where the kernel
  /// refuses to watch it.
  [[nodiscard]] Watch watch(int fd, uint32_t epollEvents, EventHandler handler);
  [[nodiscard]] Timer after(std::chrono::milliseconds delay, Work work);

  [[nodiscard]] bool isCurrent() const;

 private:
  const std::shared_ptr<State> state_;
};

}  // namespace qv::platform
