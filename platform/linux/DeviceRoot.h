#pragma once

#include <string>

namespace qv::platform {

/// QUORVEL_DEVICE_ROOT without trailing separators; empty on a device.
[[nodiscard]] std::string deviceRootFromEnvironment();
/// QUORVEL_BUNDLE_PATH.
[[nodiscard]] std::string bundlePathFromEnvironment();

}  // namespace qv::platform
