// Confines itself and becomes an extension. The daemon starts it for each extension process:
//
//   quorvel-extension-launcher DAEMON-PID DATA-DIRECTORY BUNDLE CONTAINER EXECUTABLE USER
//
// with the extension's environment, its two endpoints as the descriptors 3 and 4, and a socket as descriptor 5, from
// which comes one byte when all that is to be done from outside is done. The paths are absolute. USER is the id of the
// extension's own user; 0 where the daemon is not root, and the extension is its user's. It is a program of its own
// because what is to be done takes more than may be done between fork and exec in a process with threads. Status 126:
// the extension could not be confined and was not run; 127: its executable could not be run.
//
//   quorvel-extension-launcher guard
//
// is the guard of an extension that runs (launcher/Guard.h).
#include <signal.h>
#include <sys/prctl.h>
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
#include "platform/linux/launcher/Guard.h"
#include "platform/linux/launcher/Landlock.h"
#include "platform/linux/launcher/Limits.h"
#include "platform/linux/launcher/SystemCallFilter.h"

namespace {

using namespace qv::platform::launcher;

constexpr int kNotConfined = 126;
constexpr int kNotRun = 127;
constexpr int kGo = 5;
constexpr int kFirstUnneededDescriptor = kGo + 1;

struct Plan {
  pid_t daemon;
  std::string dataDirectory, bundle, container, executable;
  uid_t user;  ///< 0: that of the daemon
};

/// Also ends where the daemon does.
void awaitGo() {
  char byte = 0;
  if (::read(kGo, &byte, 1) != 1) throw std::runtime_error("the daemon is gone");
  ::close(kGo);
}

/// No extension outlives the daemon. A change of user resets this, so it comes after that.
void endWithDaemon(pid_t daemon) {
  if (::prctl(PR_SET_PDEATHSIG, SIGKILL) != 0 || ::getppid() != daemon) throw std::runtime_error("the daemon is gone");
}

void confine(const Plan& plan) {
  const int version = landlockVersion();
  if (version == 0 && plan.user == 0)
    throw std::runtime_error("the kernel has no Landlock, and the daemon is not root");
  std::optional<AnotherUser> user;
  if (plan.user != 0) {
    user.emplace(plan.user, AnotherUser::View{plan.dataDirectory, plan.container, version > 0});
  }
  std::optional<Landlock> landlock;
  if (version > 0) landlock.emplace(plan.bundle, plan.container);
  emptyBoundingSet();
  if (user) user->become();
  dropCapabilities();
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    throw std::system_error(errno, std::generic_category(), "no new privileges");
  }
  endWithDaemon(plan.daemon);
  // TMPDIR, made by its owner.
  (void)::mkdir((plan.container + "/tmp").c_str(), 0700);
  if (landlock) landlock->enter();
  installSystemCallFilter({.landlockVersion = version, .hasOwnUser = plan.user != 0});
}

}  // namespace

/// Leaves without exit handlers, which may not do here what they do elsewhere.
[[noreturn]] void leave(int status, const char* what, const char* why) {
  std::fprintf(stderr, "%s: %s\n", what, why);
  ::_exit(status);
}

int main(int argc, char** argv) {
  if (argc == 2 && std::strcmp(argv[1], "guard") == 0) return guardExtension();
  if (argc != 7) return kNotConfined;
  const Plan plan{static_cast<pid_t>(std::atoi(argv[1])),
                  argv[2],
                  argv[3],
                  argv[4],
                  argv[5],
                  static_cast<uid_t>(std::strtoul(argv[6], nullptr, 10))};
  try {
    if (::syscall(SYS_close_range, kFirstUnneededDescriptor, ~0u, 0) != 0) throw std::runtime_error("close_range");
    awaitGo();
    setLimits(plan.user != 0);
    confine(plan);
    limitAddressSpace();
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
