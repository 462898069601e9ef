#pragma once

#include <filesystem>
#include <string>

#include "platform/StatusBar.h"

namespace qv::platform {

/// The status bar of a display that has none: a small window in the upper right corner (IndicatorWindow).
///
/// Threading: thread-safe. One thread and one connection for each override that is shown.
class X11StatusBar final : public StatusBarOverrideCoordinator {
 public:
  /// `moduleDirectory`: where kIndicatorModule stands, as for pathOfModule.
  X11StatusBar(std::string display, const std::filesystem::path& moduleDirectory);
  std::unique_ptr<StatusBarOverrideAssertion> acquire(
      const StatusBarOverride& shown, std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate) override;

 private:
  const std::string display_;
  const std::filesystem::path module_;
};

}  // namespace qv::platform
