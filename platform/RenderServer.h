#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>

namespace qv::platform {

/// The render server's knowledge of layer contexts.
class RenderServer {
 public:
  virtual ~RenderServer() = default;
  /// The process that owns a layer context; nothing for context 0, an unknown context, or one
  /// whose owner cannot be established beyond doubt.
  [[nodiscard]] virtual std::optional<pid_t> ownerOfContext(uint32_t contextID) = 0;
};

}  // namespace qv::platform
