#include "platform/x11/X11RenderServer.h"

#include "platform/x11/ClientWindows.h"

namespace qv::platform {

std::optional<pid_t> X11RenderServer::ownerOfContext(uint32_t contextID) {
  return connection_.ask<std::optional<pid_t>>(
      std::nullopt, [&](XcbConnection& connection) { return processOfWindow(connection, contextID); });
}

}  // namespace qv::platform
