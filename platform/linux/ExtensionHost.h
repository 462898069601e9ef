#pragma once

#include <atomic>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>

#include "platform/Extensions.h"
#include "platform/linux/ExtensionStarter.h"
#include "platform/threads/Guarded.h"
#include "platform/threads/Timer.h"

namespace qv::platform {

class ExtensionProcesses;

/// What the processes of all extensions share. The services are borrowed and outlive it.
///
/// Threading: thread-safe; the first members do not change.
struct ExtensionHost {
  /// Where a request went, for as long as it can be asked.
  struct Place {
    std::shared_ptr<ExtensionHostContext> context;
    std::shared_ptr<IPCConnection> auxiliary;
  };
  using MakeContext = std::function<std::shared_ptr<ExtensionHostContext>()>;

  IPCService& ipc;
  TimerService& timers;
  Executor& executor;
  const std::unique_ptr<ExtensionStarter> starter;
  Guarded<std::map<std::string, MakeContext>> contextClasses{};  ///< by extension point
  Guarded<std::map<ExtensionRequestID, Place>> places{};         ///< of the requests that were begun
  Guarded<std::set<std::shared_ptr<ExtensionProcesses>>> uses{};
  std::atomic<ExtensionRequestID> lastRequest{0};
};

}  // namespace qv::platform
