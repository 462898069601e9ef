#include "platform/threads/RunLoop.h"

#include <pthread.h>

#include <csignal>

namespace qv::platform {
namespace {
sigset_t terminationSignals() {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGTERM);
  sigaddset(&set, SIGINT);
  sigaddset(&set, SIGHUP);
  return set;
}
}  // namespace

void blockTerminationSignals() {
  const sigset_t set = terminationSignals();
  pthread_sigmask(SIG_BLOCK, &set, nullptr);
  // A peer that closes its socket is an error of the write, not the end of the process.
  std::signal(SIGPIPE, SIG_IGN);
  // As is one beyond a limit of a file's size; and a limit of processor time is no reason to lose a recording.
  std::signal(SIGXFSZ, SIG_IGN);
  std::signal(SIGXCPU, SIG_IGN);
}

int runMainRunLoop() {
  const sigset_t set = terminationSignals();
  int signal = 0;
  while (sigwait(&set, &signal) != 0) {
  }
  return signal;
}

SerialQueue& mainQueue() {
  static SerialQueue* const queue = new SerialQueue("com.tarnwick.quorveld.main");
  return *queue;
}

}  // namespace qv::platform
