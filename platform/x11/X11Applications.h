#pragma once

#include <memory>

#include "platform/Applications.h"
#include "platform/x11/Desktop.h"
#include "platform/x11/QueryConnection.h"

namespace qv::platform {

/// Applications as the X server knows them: processes that own top-level windows and belong to a
/// bundle.
///
/// In front is the owner of the window that the window manager calls active; without a window
/// manager the owner of the window that has the keyboard focus; and where nobody gave the focus
/// to a window, the application of the topmost visible window. It alone has the state Foreground;
/// the others that own windows, visible or not, have the state Background.
///
/// Threading: thread-safe, blocking (some round trips to the server).
class X11ApplicationService final : public ApplicationService {
 public:
  X11ApplicationService(std::shared_ptr<QueryConnection> connection, BundleLookup bundleOfProcess);
  /// The monitor holds a thread and a connection while it has a handler, else neither.
  std::unique_ptr<ApplicationStateMonitor> createStateMonitor() override;
  [[nodiscard]] std::optional<std::string> frontmostApplication() override;

 private:
  const std::shared_ptr<QueryConnection> connection_;
  const BundleLookup bundleOfProcess_;
};

}  // namespace qv::platform
