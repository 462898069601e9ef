#pragma once

#include <sys/types.h>

#include <functional>
#include <memory>

#include "platform/Extensions.h"
#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// An extension's process that was started. Destroying it ends the process where it still runs.
///
/// Threading: thread-safe; destroy it from another thread than the one that its handlers come on.
class StartedExtension {
 public:
  virtual ~StartedExtension() = default;
  /// Nobody else's before this object is destroyed.
  [[nodiscard]] virtual pid_t processIdentifier() const = 0;
  /// SIGKILL; does not wait for the end.
  virtual void kill() = 0;
};

/// On a thread of the started extension's.
struct StartedExtensionHandlers {
  std::function<void(int)> didEnd;             ///< once, with the status as of waitpid
  std::function<void(const Error&)> willKill;  ///< before that, where the process is killed for what it did
};

/// What an extension's process inherits, to connect to.
struct ExtensionEndpoints {
  SharedFileDescriptor requests;
  SharedFileDescriptor auxiliary;
};

/// Starts extensions' processes, confined (docs/broadcast-extensions.md), and sees to it that none outlives this
/// process: in this process, or by the service that may do what this process may not.
///
/// Threading: thread-safe, blocking.
class ExtensionStarter {
 public:
  virtual ~ExtensionStarter() = default;
  virtual Result<std::unique_ptr<StartedExtension>> start(const ExtensionRecord& extension,
                                                          const ExtensionEndpoints& endpoints,
                                                          StartedExtensionHandlers handlers) = 0;
};

}  // namespace qv::platform
