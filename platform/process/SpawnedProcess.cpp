#include "platform/process/SpawnedProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

namespace qv::platform {
namespace {

constexpr int kFirstInherited = 3;

/// Threading: one thread.
class SpawnSettings {
 public:
  explicit SpawnSettings(const SpawnRequest& request) {
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    if (request.output.isValid()) {
      posix_spawn_file_actions_adddup2(&actions, request.output.get(), STDOUT_FILENO);
    } else {
      posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    }
    if (request.joinsErrors) {
      posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
    } else {
      posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
    }
    addDescriptors(request.descriptors);
    // The daemon blocks and ignores signals; the program must not inherit that.
    sigset_t none, all;
    sigemptyset(&none);
    sigfillset(&all);
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setsigdefault(&attributes, &all);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSID);
  }
  ~SpawnSettings() {
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
  }
  SpawnSettings(const SpawnSettings&) = delete;
  SpawnSettings& operator=(const SpawnSettings&) = delete;

  posix_spawn_file_actions_t actions;
  posix_spawnattr_t attributes;

 private:
  void addDescriptors(const std::vector<SharedFileDescriptor>& descriptors) {
    const int afterLast = kFirstInherited + static_cast<int>(descriptors.size());
    int target = kFirstInherited;
    for (const auto& descriptor : descriptors) {
      // Copied above all targets, so that none is overwritten before it is inherited.
      copies_.emplace_back(::fcntl(descriptor->get(), F_DUPFD_CLOEXEC, afterLast));
      posix_spawn_file_actions_adddup2(&actions, copies_.back().get(), target++);
    }
  }

  std::vector<FileDescriptor> copies_;
};

std::vector<char*> pointersTo(std::vector<std::string>& strings) {
  std::vector<char*> pointers;
  for (auto& string : strings) pointers.push_back(string.data());
  pointers.push_back(nullptr);
  return pointers;
}

}  // namespace

Result<SpawnedProcess> SpawnedProcess::start(SpawnRequest request) {
  request.arguments.insert(request.arguments.begin(), request.program);
  const SpawnSettings settings(request);
  SpawnedProcess process;
  const int failure =
      ::posix_spawnp(&process.processIdentifier_, request.program.c_str(), &settings.actions, &settings.attributes,
                     pointersTo(request.arguments).data(), pointersTo(request.environment).data());
  if (failure != 0) return Error::posix(failure, request.program);
  // Nobody else waits for our children, so that this is still the one just made.
  process.handle_.reset(static_cast<int>(::syscall(SYS_pidfd_open, process.processIdentifier_, 0)));
  if (process.handle_.isValid()) return process;
  const int noHandle = errno;
  ::kill(process.processIdentifier_, SIGKILL);
  ::waitpid(process.processIdentifier_, nullptr, 0);
  return Error::posix(noHandle, "pidfd_open");
}

SpawnedProcess::~SpawnedProcess() {
  if (!handle_.isValid()) return;
  sendSignal(SIGKILL);
  siginfo_t info{};
  while (::waitid(P_PIDFD, static_cast<id_t>(handle_.get()), &info, WEXITED) != 0 && errno == EINTR) {
  }
}

void SpawnedProcess::sendSignal(int signal) const {
  if (handle_.isValid()) ::syscall(SYS_pidfd_send_signal, handle_.get(), signal, nullptr, 0);
}

int SpawnedProcess::waitForEnd() const {
  siginfo_t info{};
  while (::waitid(P_PIDFD, static_cast<id_t>(handle_.get()), &info, WEXITED | WNOWAIT) != 0 && errno == EINTR) {
  }
  return info.si_code == CLD_EXITED ? info.si_status << 8 : info.si_status;
}

}  // namespace qv::platform
