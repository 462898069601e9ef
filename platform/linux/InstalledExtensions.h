#pragma once

#include <vector>

#include "platform/Extensions.h"
#include "platform/linux/LinuxBundleService.h"

namespace qv::platform {

/// The installed bundles that are extensions, by path. One that is unusable, or has the identifier of one before it, is
/// left out, and the log tells. Blocking.
[[nodiscard]] std::vector<ExtensionRecordRef> installedExtensions(LinuxBundleService& bundles);

}  // namespace qv::platform
