#include "tools/quorvelctl/Signals.h"

#include <poll.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <csignal>
#include <initializer_list>

namespace ctl {

Signals::Signals() {
  sigset_t ends;
  sigemptyset(&ends);
  for (const int signal : {SIGINT, SIGTERM, SIGHUP}) sigaddset(&ends, signal);
  ::pthread_sigmask(SIG_BLOCK, &ends, nullptr);
  descriptor_ = ::signalfd(-1, &ends, SFD_CLOEXEC | SFD_NONBLOCK);
}

Signals::~Signals() { ::close(descriptor_); }

bool Signals::await(int milliseconds) const {
  pollfd wanted{descriptor_, POLLIN, 0};
  return ::poll(&wanted, 1, milliseconds) > 0 && take();
}

bool Signals::take() const {
  signalfd_siginfo signal{};
  return ::read(descriptor_, &signal, sizeof signal) == sizeof signal;
}

}  // namespace ctl
