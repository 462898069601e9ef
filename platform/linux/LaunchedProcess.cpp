#include "platform/linux/LaunchedProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>

#include <cerrno>
#include <utility>

#include "platform/linux/ExtensionWatch.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

/// It holds the process, and an end of what breaks when the daemon ends.
Result<SpawnedProcess> startGuard(const SpawnedProcess& process, const ExtensionLaunch& launch,
                                  const std::string& launcher) {
  FileDescriptor handle(::fcntl(process.handle(), F_DUPFD_CLOEXEC, 0));
  if (!handle.isValid()) return Error::posix(errno, "guard");
  SpawnRequest guard;
  guard.program = launcher;
  guard.arguments = {"guard"};
  guard.descriptors = {shareFileDescriptor(std::move(handle)), launch.launcherLife};
  return SpawnedProcess::start(std::move(guard));
}

}  // namespace

Result<std::unique_ptr<LaunchedProcess>> LaunchedProcess::start(ExtensionLaunch launch,
                                                                StartedExtensionHandlers handlers) {
  std::unique_ptr<LaunchedProcess> process(new LaunchedProcess());
  Started started;
  auto outcome = started.get_future();
  process->thread_ = std::thread(
      [self = process.get(), launch = std::move(launch), started = std::move(started),
       handlers = std::move(handlers)]() mutable { self->run(std::move(launch), std::move(started), handlers); });
  if (auto failure = outcome.get()) return *failure;
  return process;
}

void LaunchedProcess::run(ExtensionLaunch launch, Started started, const StartedExtensionHandlers& handlers) {
  const std::string launcher = launch.request.program;
  auto process = SpawnedProcess::start(std::move(launch.request));
  if (!process) return started.set_value(process.error());
  process_ = std::move(*process);
  auto guard = startGuard(process_, launch, launcher);
  if (!guard) return started.set_value(guard.error());
  guard_ = std::move(*guard);
  auto failure = letGo(launch);
  const bool isRunning = !failure;
  started.set_value(std::move(failure));
  if (!isRunning) return;
  const int status = ExtensionWatch(process_, guard_, launch, handlers.willKill).waitForEnd();
  // What the process had is given back before its end is told.
  launch.cgroup.reset();
  handlers.didEnd(status);
}

std::optional<Error> LaunchedProcess::letGo(const ExtensionLaunch& launch) {
  if (launch.cgroup) {
    if (const auto failure = launch.cgroup->add(process_.processIdentifier())) {
      QV_LOG_ERROR(logs::kExtensions, "an extension runs outside its cgroup: %s", failure->description().c_str());
    }
  }
  const char go = 1;
  // One that has ended already tells so by its status.
  if (::send(launch.life.get(), &go, 1, MSG_NOSIGNAL) == 1 || errno == EPIPE) return std::nullopt;
  return Error::posix(errno, "launcher");
}

void LaunchedProcess::kill() { process_.sendSignal(SIGKILL); }

LaunchedProcess::~LaunchedProcess() {
  process_.sendSignal(SIGKILL);
  if (thread_.joinable()) thread_.join();
}

}  // namespace qv::platform
