#pragma once

#include <sys/types.h>

#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <thread>

#include "platform/linux/ExtensionLaunch.h"
#include "platform/process/SpawnedProcess.h"

namespace qv::platform {

/// An extension's process, its guard, and a thread that watches over both until the end (ExtensionWatch).
///
/// That thread has also made the process, since PR_SET_PDEATHSIG looks at the death of the parent's thread.
///
/// Threading: thread-safe; destroy it from another thread than the one that its handlers come on.
class LaunchedProcess {
 public:
  /// On the watching thread.
  struct Handlers {
    std::function<void(int)> didEnd;             ///< once, with the status as of waitpid
    std::function<void(const Error&)> willKill;  ///< before that, where the process is killed for what it did
  };
  static Result<std::unique_ptr<LaunchedProcess>> start(ExtensionLaunch launch, Handlers handlers);
  /// Kills the process where it still runs, and waits for its end.
  ~LaunchedProcess();
  LaunchedProcess(const LaunchedProcess&) = delete;
  LaunchedProcess& operator=(const LaunchedProcess&) = delete;

  [[nodiscard]] pid_t processIdentifier() const { return process_.processIdentifier(); }
  void sendSignal(int signal) const { process_.sendSignal(signal); }

 private:
  using Started = std::promise<std::optional<Error>>;

  LaunchedProcess() = default;
  void run(ExtensionLaunch launch, Started started, const Handlers& handlers);
  std::optional<Error> letGo(const ExtensionLaunch& launch);

  SpawnedProcess process_;
  SpawnedProcess guard_;
  std::thread thread_;
};

}  // namespace qv::platform
