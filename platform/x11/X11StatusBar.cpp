#include "platform/x11/X11StatusBar.h"

#include <utility>

#include "platform/x11/IndicatorModule.h"
#include "platform/x11/IndicatorWindow.h"

namespace qv::platform {

X11StatusBar::X11StatusBar(std::string display, const std::filesystem::path& moduleDirectory)
    : display_(std::move(display)), module_(pathOfModule(moduleDirectory, kIndicatorModule)) {}

std::unique_ptr<StatusBarOverrideAssertion> X11StatusBar::acquire(
    const StatusBarOverride& shown, std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate) {
  return std::make_unique<IndicatorWindow>(display_, module_, shown, std::move(delegate));
}

}  // namespace qv::platform
