#pragma once

#include "platform/StatusBar.h"

namespace qv::platform {

/// A status bar that the log shows: a line when it appears, says something else, or goes. Nobody presses it.
///
/// Threading: thread-safe.
class HeadlessStatusBar final : public StatusBarOverrideCoordinator {
 public:
  std::unique_ptr<StatusBarOverrideAssertion> acquire(
      const StatusBarOverride& shown, std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate) override;
};

}  // namespace qv::platform
