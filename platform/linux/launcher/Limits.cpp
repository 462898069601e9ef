#include "platform/linux/launcher/Limits.h"

#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <system_error>

#include "platform/linux/ExtensionBounds.h"

namespace qv::platform::launcher {
namespace {

void limit(decltype(RLIMIT_CORE) resource, rlim_t most) {
  rlimit limits{};
  if (::getrlimit(resource, &limits) != 0) return;
  if (limits.rlim_max == RLIM_INFINITY || limits.rlim_max > most) limits.rlim_max = most;
  limits.rlim_cur = limits.rlim_max;
  if (::setrlimit(resource, &limits) != 0) throw std::system_error(errno, std::generic_category(), "limits");
}

void beFirstWhenMemoryRunsOut() {
  const int score = ::open("/proc/self/oom_score_adj", O_WRONLY | O_CLOEXEC);
  if (score < 0) return;
  const std::string text = std::to_string(extensionbounds::kOutOfMemoryScore);
  (void)!::write(score, text.data(), text.size());
  ::close(score);
}

}  // namespace

void setLimits(bool hasOwnUser) {
  limit(RLIMIT_CORE, 0);
  limit(RLIMIT_NOFILE, extensionbounds::kOpenFiles);
  limit(RLIMIT_FSIZE, extensionbounds::kFileSize);
  limit(RLIMIT_MEMLOCK, extensionbounds::kLockedMemory);
  limit(RLIMIT_MSGQUEUE, 0);
  limit(RLIMIT_RTPRIO, 0);
  limit(RLIMIT_NICE, 0);
  if (hasOwnUser) limit(RLIMIT_NPROC, extensionbounds::kThreads);
  // A write beyond the limit fails instead of ending the program; this outlives exec.
  (void)::signal(SIGXFSZ, SIG_IGN);
  beFirstWhenMemoryRunsOut();
}

void limitAddressSpace() { limit(RLIMIT_AS, extensionbounds::kAddressSpace); }

}  // namespace qv::platform::launcher
