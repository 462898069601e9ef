#pragma once

#include <cstdint>
#include <vector>

#include "platform/base/SharedFrame.h"

namespace qv::platform::ffmpeg {

/// Where a 4:2:0 picture of three planes goes; sides are even.
struct PlanarPicture {
  int width = 0;
  int height = 0;
  uint8_t* planes[3] = {};
  int strides[3] = {};
};

/// Converts captured pictures to what the encoder takes: 4:2:0, BT.601, limited range.
///
/// A picture of another size is scaled into the middle and keeps its shape, with black beside it;
/// one that is a pixel short (odd sides are rounded up) has its last column and row repeated.
///
/// Threading: confined to one thread.
class ColorConverter {
 public:
  void convert(const PixelBuffer& image, const PlanarPicture& out);
  /// The same, and then a quarter turn counterclockwise: the picture's top comes to lie on the left.
  void convertTurned(const PixelBuffer& image, const PlanarPicture& out);

 private:
  void scaleInto(const FrameLayout& layout, const uint8_t* pixels, const PlanarPicture& out);
  std::vector<uint8_t> scaled_;
  std::vector<uint8_t> upright_;
};

}  // namespace qv::platform::ffmpeg
