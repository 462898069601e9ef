#pragma once

#include <chrono>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>

namespace comet {

using Instant = std::chrono::nanoseconds;  ///< of CLOCK_MONOTONIC
Instant now();

/// The program's one thread: frames, window events, timed steps, and work from other threads.
///
/// Threading: `post` is thread-safe; everything else is for the thread of `run`.
class MainLoop {
 public:
  MainLoop();
  ~MainLoop();
  MainLoop(const MainLoop&) = delete;
  MainLoop& operator=(const MainLoop&) = delete;

  /// Queues work; callable from any thread.
  void post(std::function<void()> work);
  /// Calls `work` whenever `fd` has input.
  void watch(int fd, std::function<void()> work);
  /// Calls `work` `framesPerSecond` times a second, with the instants of this frame and of the one after.
  /// Frames lie on whole fractions of a second of CLOCK_MONOTONIC; late ones are left out.
  void everyFrame(int framesPerSecond, std::function<void(Instant frame, Instant next)> work);
  /// Calls `work` once at `instant`; replaces an earlier one.
  void at(Instant instant, std::function<void()> work);
  /// Returns after `quit`, or when the process is asked to end.
  void run();
  void quit() { running_ = false; }

 private:
  void runPosted();
  void runTimers();
  [[nodiscard]] Instant nextWakeUp() const;

  int wakeUp_ = -1, signals_ = -1;
  std::mutex mutex_;
  std::deque<std::function<void()>> posted_;
  int watched_ = -1;
  std::function<void()> watchWork_;
  int framesPerSecond_ = 0;
  std::function<void(Instant, Instant)> frameWork_;
  int64_t nextFrame_ = 0;  // in frames since instant 0
  std::optional<Instant> timer_;
  std::function<void()> timerWork_;
  bool running_ = true;
};

}  // namespace comet
