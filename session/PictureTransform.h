#pragma once

#include <cstdint>

#include "platform/base/Geometry.h"

namespace qv {

/// The EXIF orientation (1 to 8) of the capture service's transform flags.
uint32_t orientationFromVellTransform(uint64_t transformFlags);
/// The movie transform of the flags: bit 2 quarter turn, bit 1 mirrored in x, bit 0 in y.
platform::AffineTransform _affineTransformFromVellTransformFlags(uint64_t transformFlags);

}  // namespace qv
