#pragma once

#include <sys/types.h>

#include <map>
#include <string>

#include "platform/threads/EventLoop.h"

namespace qv::platform::sdbus {

/// The lines about peers that were refused or dropped: for each user one a second at most, with a count of the others.
///
/// Threading: the thread of the loop.
class RefusalLog {
 public:
  /// `loop` outlives this, or has been stopped.
  explicit RefusalLog(EventLoop& loop) : loop_(loop) {}
  void note(uid_t user, const std::string& what);

 private:
  struct Second {
    size_t others = 0;  ///< that had no line of their own
    std::string last;   ///< of them
    EventLoop::Timer end;
  };
  void begin(uid_t user, Second& second);
  void sumUp(uid_t user);

  EventLoop& loop_;
  std::map<uid_t, Second> seconds_;
};

}  // namespace qv::platform::sdbus
