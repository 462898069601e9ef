#include "tools/quorvelctl/recorder/Loop.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <cstdint>
#include <utility>

namespace ctl {

Loop::Loop(const Signals& signals) : signals_(signals), wakeUp_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}
Loop::~Loop() { ::close(wakeUp_); }

void Loop::post(std::function<void()> work) {
  std::lock_guard lock(mutex_);
  posted_.push_back(std::move(work));
  ::eventfd_write(wakeUp_, 1);
}

void Loop::runPosted() {
  eventfd_t count = 0;
  ::eventfd_read(wakeUp_, &count);
  std::deque<std::function<void()>> work;
  {
    std::lock_guard lock(mutex_);
    work.swap(posted_);
  }
  for (const auto& each : work) each();
}

void Loop::tellToEnd() {
  if (const auto work = std::exchange(whenToEnd_, nullptr)) work();
}

void Loop::run() {
  while (isRunning_) {
    pollfd wanted[]{
        {wakeUp_, POLLIN, 0}, {signals_.descriptor(), POLLIN, 0}, {inputIsOpen_ ? STDIN_FILENO : -1, POLLIN, 0}};
    if (::poll(wanted, 3, -1) < 0) continue;
    if (wanted[0].revents != 0) runPosted();
    if (wanted[1].revents != 0 && signals_.take()) tellToEnd();
    char byte = 0;
    if (wanted[2].revents != 0 && ::read(STDIN_FILENO, &byte, 1) <= 0) {
      inputIsOpen_ = false;
      tellToEnd();
    }
  }
}

}  // namespace ctl
