#pragma once

#include <sys/types.h>

#include <future>
#include <memory>
#include <optional>
#include <thread>

#include "platform/linux/ExtensionLaunch.h"
#include "platform/linux/ExtensionStarter.h"
#include "platform/process/SpawnedProcess.h"

namespace qv::platform {

/// An extension's process, its guard, and a thread that watches over both until the end (ExtensionWatch).
///
/// That thread has also made the process, since PR_SET_PDEATHSIG looks at the death of the parent's thread.
///
/// Threading: as StartedExtension.
class LaunchedProcess final : public StartedExtension {
 public:
  /// The handlers come on the watching thread.
  static Result<std::unique_ptr<LaunchedProcess>> start(ExtensionLaunch launch, StartedExtensionHandlers handlers);
  /// Waits for the process's end.
  ~LaunchedProcess() override;
  LaunchedProcess(const LaunchedProcess&) = delete;
  LaunchedProcess& operator=(const LaunchedProcess&) = delete;

  [[nodiscard]] pid_t processIdentifier() const override { return process_.processIdentifier(); }
  void kill() override;

 private:
  using Started = std::promise<std::optional<Error>>;

  LaunchedProcess() = default;
  void run(ExtensionLaunch launch, Started started, const StartedExtensionHandlers& handlers);
  std::optional<Error> letGo(const ExtensionLaunch& launch);

  SpawnedProcess process_;
  SpawnedProcess guard_;
  std::thread thread_;
};

}  // namespace qv::platform
