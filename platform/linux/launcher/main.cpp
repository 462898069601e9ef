// Confines itself and becomes an extension. The daemon starts it for each extension process:
//
//   quorvel-extension-launcher DAEMON-PID DATA-DIRECTORY BUNDLE CONTAINER EXECUTABLE [another-user]
//
// with the extension's environment, and its two endpoints as the descriptors 3 and 4. The paths are absolute. It is a
// program of its own because what is to be done takes more than may be done between fork and exec in a process with
// threads. With the last argument a root daemon's extension runs as another user even where Landlock would do. Status
// 126: the extension could not be confined and was not run; 127: its executable could not be run.
#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>

#include "platform/linux/launcher/AnotherUser.h"
#include "platform/linux/launcher/Landlock.h"
#include "platform/linux/launcher/SystemCallFilter.h"

namespace {

using namespace qv::platform::launcher;

constexpr int kNotConfined = 126;
constexpr int kNotRun = 127;
constexpr unsigned kFirstUnneededDescriptor = 5;
constexpr rlim_t kMaximumDescriptors = 1024;
/// When memory runs out, extensions go before the recording does; the scale ends at 1000.
constexpr const char kOutOfMemoryScore[] = "500";
/// Bytes. Room for any upload; a stop for one that allocates without end.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr rlim_t kMaximumAddressSpace = RLIM_INFINITY;  // the sanitizers reserve terabytes
#else
constexpr rlim_t kMaximumAddressSpace = sizeof(void*) == 8 ? rlim_t{16} << 30 : RLIM_INFINITY;
#endif

struct Plan {
  pid_t daemon;
  std::string dataDirectory, bundle, container, executable;
  bool wantsAnotherUser;
};

void limit(decltype(RLIMIT_CORE) resource, rlim_t most) {
  rlimit limits{};
  if (::getrlimit(resource, &limits) != 0) return;
  if (limits.rlim_max == RLIM_INFINITY || limits.rlim_max > most) limits.rlim_max = most;
  limits.rlim_cur = limits.rlim_max;
  if (::setrlimit(resource, &limits) != 0) throw std::system_error(errno, std::generic_category(), "limits");
}

void setLimits() {
  limit(RLIMIT_CORE, 0);
  limit(RLIMIT_NOFILE, kMaximumDescriptors);
  const int score = ::open("/proc/self/oom_score_adj", O_WRONLY | O_CLOEXEC);
  if (score < 0) return;
  (void)!::write(score, kOutOfMemoryScore, std::strlen(kOutOfMemoryScore));
  ::close(score);
}

/// No extension outlives the daemon. A change of user resets this, so it comes after that.
void endWithDaemon(pid_t daemon) {
  if (::prctl(PR_SET_PDEATHSIG, SIGKILL) != 0 || ::getppid() != daemon) throw std::runtime_error("the daemon is gone");
}

void confine(const Plan& plan) {
  const int version = landlockVersion();
  const bool isRoot = ::geteuid() == 0;
  const bool needsAnotherUser = version < kCompleteLandlockVersion || plan.wantsAnotherUser;
  if (version == 0 && !isRoot) throw std::runtime_error("the kernel has no Landlock, and the daemon is not root");
  std::optional<AnotherUser> user;
  if (isRoot && needsAnotherUser) user.emplace(plan.dataDirectory, plan.container);
  std::optional<Landlock> landlock;
  if (version > 0) landlock.emplace(plan.bundle, plan.container);
  if (user) {
    user->become();
  } else {
    dropCapabilities();
  }
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    throw std::system_error(errno, std::generic_category(), "no new privileges");
  }
  endWithDaemon(plan.daemon);
  if (landlock) landlock->enter();
  installSystemCallFilter(version);
}

}  // namespace

/// Leaves without exit handlers, which may not do here what they do elsewhere.
[[noreturn]] void leave(int status, const char* what, const char* why) {
  std::fprintf(stderr, "%s: %s\n", what, why);
  ::_exit(status);
}

int main(int argc, char** argv) {
  if (argc != 6 && argc != 7) return kNotConfined;
  const Plan plan{static_cast<pid_t>(std::atoi(argv[1])), argv[2], argv[3], argv[4], argv[5], argc == 7};
  try {
    if (::syscall(SYS_close_range, kFirstUnneededDescriptor, ~0u, 0) != 0) throw std::runtime_error("close_range");
    setLimits();
    confine(plan);
    limit(RLIMIT_AS, kMaximumAddressSpace);
  } catch (const std::exception& failure) {
    leave(kNotConfined, "not confined", failure.what());
  }
  ::umask(077);
  if (::chdir(plan.container.c_str()) == 0) {
    char* const arguments[] = {argv[5], nullptr};
    ::execv(plan.executable.c_str(), arguments);
  }
  leave(kNotRun, plan.executable.c_str(), std::strerror(errno));
}
