#pragma once

#include <deque>
#include <functional>
#include <mutex>

#include "tools/quorvelctl/Signals.h"

namespace ctl {

/// The one thread of the program that records: what the library brings, and the wish that it ends.
///
/// Threading: `post` is thread-safe; everything else is for the thread of `run`.
class Loop {
 public:
  explicit Loop(const Signals& signals);
  ~Loop();
  Loop(const Loop&) = delete;
  Loop& operator=(const Loop&) = delete;

  void post(std::function<void()> work);
  /// Called once: at a signal that ends the program, or when standard input has been closed.
  void whenToEnd(std::function<void()> work) { whenToEnd_ = std::move(work); }
  /// Until `quit`. What the work throws comes out.
  void run();
  void quit() { isRunning_ = false; }

 private:
  void runPosted();
  void tellToEnd();

  const Signals& signals_;
  int wakeUp_ = -1;
  std::mutex mutex_;
  std::deque<std::function<void()>> posted_;  ///< guarded by mutex_
  std::function<void()> whenToEnd_;
  bool isRunning_ = true, inputIsOpen_ = true;
};

}  // namespace ctl
