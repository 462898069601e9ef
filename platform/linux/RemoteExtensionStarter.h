#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/linux/ExtensionStarter.h"

namespace qv::platform {

/// Has extensions started by the service at a socket (ExtensionStarterServer), so that this process needs no right for
/// it. Each process has a connection, by which the service ends it where this process ends. When the service ends, so
/// do the processes: their end is told as that by SIGKILL, and the next start connects anew.
///
/// Threading: as ExtensionStarter. A started process has a thread, which waits for its end.
class RemoteExtensionStarter final : public ExtensionStarter {
 public:
  explicit RemoteExtensionStarter(std::string socketPath) : socketPath_(std::move(socketPath)) {}
  /// Waits 10 s at most for the answer.
  Result<std::unique_ptr<StartedExtension>> start(const ExtensionRecord& extension, const ExtensionEndpoints& endpoints,
                                                  StartedExtensionHandlers handlers) override;

 private:
  const std::string socketPath_;
};

/// What routeReachabilityOfHost says in that service, which has the network; nothing where it does not answer.
/// Blocking.
[[nodiscard]] std::optional<uint32_t> remoteReachabilityOfHost(const std::string& socketPath, const std::string& host);

}  // namespace qv::platform
