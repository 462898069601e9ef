#pragma once

#include <vector>

#include "platform/x11/Desktop.h"
#include "platform/x11/WindowLayout.h"

namespace qv::platform {

/// The windows of the display, bottom to top, without the desktop's background. Some round trips.
std::vector<ShownWindow> readShownWindows(XcbConnection& connection, const BundleLookup& bundleOfProcess);

}  // namespace qv::platform
