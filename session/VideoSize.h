#pragma once

#include <cstdint>

#include "platform/DeviceInfo.h"
#include "platform/Preferences.h"
#include "platform/base/Geometry.h"

namespace qv {

/// The size at which the device records a wish: the same shape, neither side above what the device can.
///
/// Threading: thread-safe.
[[nodiscard]] platform::Size _maximumSizeWithSize(platform::Size size, platform::PreferenceStore& preferences,
                                                  platform::DeviceInfoQuery& device);
/// Of the device; 0 where it does not say.
[[nodiscard]] int64_t chipId(platform::DeviceInfoQuery& device);
/// So a system recording's movie is never wider than tall.
[[nodiscard]] constexpr bool isNativeScreenOrientationPortrait() { return true; }

}  // namespace qv
