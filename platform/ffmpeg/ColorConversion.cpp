#include "platform/ffmpeg/ColorConversion.h"

#include <libyuv.h>

#include <algorithm>
#include <cstring>

namespace qv::platform::ffmpeg {
namespace {

constexpr int kBlackLuma = 16;
constexpr int kNoChroma = 128;

void convertInto(const uint8_t* pixels, int stride, int width, int height, const PlanarPicture& out) {
  libyuv::ARGBToI420(pixels, stride, out.planes[0], out.strides[0], out.planes[1], out.strides[1], out.planes[2],
                     out.strides[2], width, height);
}

void repeatEdges(int width, int height, const PlanarPicture& out) {
  if (width < out.width) {
    for (int y = 0; y < height; ++y) {
      uint8_t* row = out.planes[0] + ptrdiff_t{y} * out.strides[0];
      row[width] = row[width - 1];
    }
  }
  if (height < out.height) {
    uint8_t* last = out.planes[0] + ptrdiff_t{height} * out.strides[0];
    std::memcpy(last, last - out.strides[0], static_cast<size_t>(out.width));
  }
}

int evenPart(double value) { return std::max(2, static_cast<int>(value + 0.5) / 2 * 2); }

}  // namespace

void ColorConverter::convert(const PixelBuffer& image, const PlanarPicture& out) {
  const FrameLayout& layout = image.sharedFrame()->layout();
  const uint8_t* pixels = image.sharedFrame()->bytes().data();
  const int width = static_cast<int>(layout.width);
  const int height = static_cast<int>(layout.height);
  if (width + width % 2 != out.width || height + height % 2 != out.height) return scaleInto(layout, pixels, out);
  convertInto(pixels, static_cast<int>(layout.stride), width, height, out);
  repeatEdges(width, height, out);
}

void ColorConverter::convertTurned(const PixelBuffer& image, const PlanarPicture& out) {
  const int width = out.height, height = out.width;
  const auto luma = size_t(width) * size_t(height);
  upright_.resize(luma * 3 / 2);
  const PlanarPicture upright{width,
                              height,
                              {upright_.data(), upright_.data() + luma, upright_.data() + luma * 5 / 4},
                              {width, width / 2, width / 2}};
  convert(image, upright);
  libyuv::I420Rotate(upright.planes[0], upright.strides[0], upright.planes[1], upright.strides[1], upright.planes[2],
                     upright.strides[2], out.planes[0], out.strides[0], out.planes[1], out.strides[1], out.planes[2],
                     out.strides[2], width, height, libyuv::kRotate270);
}

void ColorConverter::scaleInto(const FrameLayout& layout, const uint8_t* pixels, const PlanarPicture& out) {
  const double ratio = std::min(double(out.width) / layout.width, double(out.height) / layout.height);
  const int width = std::min(out.width, evenPart(layout.width * ratio));
  const int height = std::min(out.height, evenPart(layout.height * ratio));
  scaled_.resize(size_t(width) * 4 * size_t(height));
  libyuv::ARGBScale(pixels, static_cast<int>(layout.stride), static_cast<int>(layout.width),
                    static_cast<int>(layout.height), scaled_.data(), width * 4, width, height, libyuv::kFilterBilinear);
  libyuv::I420Rect(out.planes[0], out.strides[0], out.planes[1], out.strides[1], out.planes[2], out.strides[2], 0, 0,
                   out.width, out.height, kBlackLuma, kNoChroma, kNoChroma);
  const int left = (out.width - width) / 4 * 2;
  const int top = (out.height - height) / 4 * 2;
  PlanarPicture inner = out;
  inner.planes[0] += ptrdiff_t{top} * out.strides[0] + left;
  for (int plane = 1; plane < 3; ++plane) inner.planes[plane] += ptrdiff_t{top / 2} * out.strides[plane] + left / 2;
  convertInto(scaled_.data(), width * 4, width, height, inner);
}

}  // namespace qv::platform::ffmpeg
