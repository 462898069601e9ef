#pragma once

#include <sys/types.h>

#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <thread>

#include "platform/process/SpawnedProcess.h"

namespace qv::platform {

/// A child process with a thread that waits for its end.
///
/// That thread has also made the process, since PR_SET_PDEATHSIG looks at the death of the parent's thread.
///
/// Threading: thread-safe; destroy it from another thread than the one `didEnd` comes on.
class LaunchedProcess {
 public:
  /// `didEnd` gets the status as of waitpid, once, on the waiting thread.
  static Result<std::unique_ptr<LaunchedProcess>> start(SpawnRequest request, std::function<void(int)> didEnd);
  /// Kills the process where it still runs, and waits for its end.
  ~LaunchedProcess();
  LaunchedProcess(const LaunchedProcess&) = delete;
  LaunchedProcess& operator=(const LaunchedProcess&) = delete;

  [[nodiscard]] pid_t processIdentifier() const { return process_.processIdentifier(); }
  void sendSignal(int signal) const { process_.sendSignal(signal); }

 private:
  LaunchedProcess() = default;
  void run(SpawnRequest request, std::promise<std::optional<Error>> started, const std::function<void(int)>& didEnd);

  SpawnedProcess process_;
  std::thread thread_;
};

}  // namespace qv::platform
