#include "platform/linux/LaunchedProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>

#include <cerrno>
#include <utility>

namespace qv::platform {
namespace {

constexpr int kFirstInherited = 3;

/// Threading: one thread.
class SpawnSettings {
 public:
  explicit SpawnSettings(const LaunchRequest& request) {
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    if (request.output.isValid()) {
      posix_spawn_file_actions_adddup2(&actions, request.output.get(), STDOUT_FILENO);
    } else {
      posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    }
    posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
    addDescriptors(request.descriptors);
    // The daemon blocks signals; the program must not inherit that.
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

Result<std::unique_ptr<LaunchedProcess>> LaunchedProcess::start(LaunchRequest request,
                                                                std::function<void(int)> didEnd) {
  std::unique_ptr<LaunchedProcess> process(new LaunchedProcess());
  std::promise<int> started;
  auto outcome = started.get_future();
  const std::string program = request.program;
  process->thread_ = std::thread(
      [self = process.get(), request = std::move(request), started = std::move(started),
       didEnd = std::move(didEnd)]() mutable { self->run(std::move(request), std::move(started), didEnd); });
  if (const int failure = outcome.get()) return Error::posix(failure, program);
  return process;
}

/// 0, or the errno. What is inherited is closed here when it returns.
int LaunchedProcess::spawn(const LaunchRequest request) {
  std::vector<std::string> arguments{request.program};
  arguments.insert(arguments.end(), request.arguments.begin(), request.arguments.end());
  std::vector<std::string> environment = request.environment;
  const SpawnSettings settings(request);
  pid_t pid = 0;
  const int failure = ::posix_spawn(&pid, request.program.c_str(), &settings.actions, &settings.attributes,
                                    pointersTo(arguments).data(), pointersTo(environment).data());
  if (failure != 0) return failure;
  processIdentifier_ = pid;
  // Nobody else waits for our children, so that this is still the one just made.
  processHandle_.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
  if (processHandle_.isValid()) return 0;
  const int noHandle = errno;
  ::kill(pid, SIGKILL);
  ::waitpid(pid, nullptr, 0);
  return noHandle;
}

void LaunchedProcess::run(LaunchRequest request, std::promise<int> started, const std::function<void(int)>& didEnd) {
  const int failure = spawn(std::move(request));
  const int handle = processHandle_.get();
  started.set_value(failure);
  if (failure != 0) return;
  siginfo_t info{};
  while (::waitid(P_PIDFD, static_cast<id_t>(handle), &info, WEXITED | WNOWAIT) != 0 && errno == EINTR) {
  }
  didEnd(info.si_code == CLD_EXITED ? info.si_status << 8 : info.si_status);
}

LaunchedProcess::~LaunchedProcess() {
  if (processHandle_.isValid()) sendSignal(SIGKILL);
  if (thread_.joinable()) thread_.join();
  siginfo_t info{};
  if (processHandle_.isValid()) ::waitid(P_PIDFD, static_cast<id_t>(processHandle_.get()), &info, WEXITED);
}

void LaunchedProcess::sendSignal(int signal) const {
  ::syscall(SYS_pidfd_send_signal, processHandle_.get(), signal, nullptr, 0);
}

}  // namespace qv::platform
