#pragma once

#include <cstddef>

#include "platform/threads/EventLoop.h"

namespace qv::platform::sdbus {

/// Gives memory back to the system after many connections have gone: the allocator keeps it otherwise.
///
/// Threading: the thread of the loop.
class MemoryReturn {
 public:
  /// `loop` outlives this, or has been stopped.
  explicit MemoryReturn(EventLoop& loop) : loop_(loop) {}
  void noteGone();

 private:
  EventLoop& loop_;
  size_t gone_ = 0;  ///< connections since the last time
  EventLoop::Timer timer_;
};

}  // namespace qv::platform::sdbus
