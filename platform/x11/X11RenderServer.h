#pragma once

#include "platform/Applications.h"
#include "platform/RenderServer.h"
#include "platform/x11/QueryConnection.h"

namespace qv::platform {

/// Owners of windows, from the X server. A layer context is a window id.
///
/// Threading: thread-safe, blocking (some round trips to the server).
class X11RenderServer final : public RenderServer {
 public:
  explicit X11RenderServer(QueryConnection& connection) : connection_(connection) {}
  [[nodiscard]] std::optional<pid_t> ownerOfContext(uint32_t contextID) override;

 private:
  QueryConnection& connection_;
};

}  // namespace qv::platform
