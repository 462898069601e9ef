#include "PictureConverter.h"

#include <libyuv/rotate.h>

#include <algorithm>
#include <cmath>

extern "C" {
#include <libavutil/imgutils.h>
#include <libswscale/swscale.h>
}

namespace upload {

namespace {

using quorvel::Orientation;

/// What makes a picture upright: turned over its horizontal axis first, then clockwise.
struct Turn {
  bool isFlipped;
  libyuv::RotationMode rotation;
};

Turn turnFor(Orientation orientation) {
  switch (orientation) {
    case Orientation::Up:
      break;
    case Orientation::UpMirrored:
      return {true, libyuv::kRotate180};
    case Orientation::Down:
      return {false, libyuv::kRotate180};
    case Orientation::DownMirrored:
      return {true, libyuv::kRotate0};
    case Orientation::LeftMirrored:
      return {true, libyuv::kRotate90};
    case Orientation::Right:
      return {false, libyuv::kRotate90};
    case Orientation::RightMirrored:
      return {true, libyuv::kRotate270};
    case Orientation::Left:
      return {false, libyuv::kRotate270};
  }
  return {false, libyuv::kRotate0};
}

int nearestEven(double length) { return std::max(2, 2 * static_cast<int>(std::lround(length / 2))); }

/// The largest size of these proportions within the bounds.
PictureSize fitted(PictureSize size, PictureSize bounds) {
  const double scale = std::min(bounds.width / double(size.width), bounds.height / double(size.height));
  return {std::min(bounds.width, nearestEven(size.width * scale)),
          std::min(bounds.height, nearestEven(size.height * scale))};
}

Frame makeFrame(PictureSize size, int format) {
  Frame frame(av_frame_alloc());
  frame->format = format;
  frame->width = size.width;
  frame->height = size.height;
  return av_frame_get_buffer(frame.get(), 0) == 0 ? std::move(frame) : nullptr;
}

void blacken(AVFrame& picture) {
  const ptrdiff_t strides[] = {picture.linesize[0], picture.linesize[1], picture.linesize[2]};
  av_image_fill_black(picture.data, strides, AV_PIX_FMT_YUV420P, AVCOL_RANGE_MPEG, picture.width, picture.height);
}

}  // namespace

PictureSize uprightSize(PictureSize size, Orientation orientation) {
  const auto rotation = turnFor(orientation).rotation;
  const bool isSideways = rotation == libyuv::kRotate90 || rotation == libyuv::kRotate270;
  return isSideways ? PictureSize{size.height, size.width} : size;
}

PictureConverter::~PictureConverter() { sws_freeContext(scaler_); }

bool PictureConverter::prepare(const Layout& layout, AVFrame& to) {
  layout_.reset();
  const PictureSize whole{to.width, to.height};
  placed_ = fitted(uprightSize(layout.size, layout.orientation), whole);
  left_ = (whole.width - placed_.width) / 4 * 2;
  top_ = (whole.height - placed_.height) / 4 * 2;
  const bool isDirect = layout.orientation == Orientation::Up && placed_ == whole;
  const PictureSize scaled = uprightSize(placed_, layout.orientation);
  turned_ = isDirect ? nullptr : makeFrame(scaled, to.format);
  sws_freeContext(scaler_);
  scaler_ = sws_getContext(layout.size.width, layout.size.height, AV_PIX_FMT_BGR0, scaled.width, scaled.height,
                           AVPixelFormat(to.format), SWS_FAST_BILINEAR, nullptr, nullptr, nullptr);
  if (scaler_ == nullptr || (!isDirect && !turned_)) return false;
  sws_setColorspaceDetails(scaler_, sws_getCoefficients(SWS_CS_ITU709), 1, sws_getCoefficients(SWS_CS_ITU709), 0, 0,
                           1 << 16, 1 << 16);
  blacken(to);
  layout_ = layout;
  return true;
}

void PictureConverter::turn(AVFrame& to) const {
  const Turn turn = turnFor(layout_->orientation);
  for (int plane = 0; plane < 3; ++plane) {
    const int shift = plane == 0 ? 0 : 1;
    uint8_t* begin = to.data[plane] + ptrdiff_t{to.linesize[plane]} * (top_ >> shift) + (left_ >> shift);
    const int height = turned_->height >> shift;
    libyuv::RotatePlane(turned_->data[plane], turned_->linesize[plane], begin, to.linesize[plane],
                        turned_->width >> shift, turn.isFlipped ? -height : height, turn.rotation);
  }
}

bool PictureConverter::convert(const quorvel::VideoFrame& frame, Orientation orientation, AVFrame& to) {
  const Layout layout{{static_cast<int>(frame.width), static_cast<int>(frame.height)}, orientation};
  if (layout.size.width < 1 || layout.size.height < 1) return false;
  if (layout_ != layout && !prepare(layout, to)) return false;
  const AVFrame& scaled = turned_ ? *turned_ : to;
  const uint8_t* const planes[] = {frame.pixels.data()};
  const int strides[] = {static_cast<int>(frame.stride)};
  if (sws_scale(scaler_, planes, strides, 0, layout.size.height, scaled.data, scaled.linesize) <= 0) return false;
  if (turned_) turn(to);
  return true;
}

}  // namespace upload
