#include "platform/x11/FrameComposer.h"

#include <libyuv.h>

#include <algorithm>
#include <cmath>
#include <optional>

namespace qv::platform {
namespace {

constexpr uint32_t kOpaqueBlack = 0xFF000000u;

PixelRect boundsOf(const std::vector<PictureLayer>& layers) {
  int32_t left = INT32_MAX, top = INT32_MAX, right = INT32_MIN, bottom = INT32_MIN;
  for (const auto& layer : layers) {
    left = std::min(left, layer.x);
    top = std::min(top, layer.y);
    right = std::max(right, layer.x + layer.area.width);
    bottom = std::max(bottom, layer.y + layer.area.height);
  }
  if (left >= right || top >= bottom) return {};
  return {left, top, right - left, bottom - top};
}

void fillBlack(SharedFrame& frame, const PixelRect& rect) {
  if (rect.width <= 0 || rect.height <= 0) return;
  libyuv::ARGBRect(frame.mutableBytes().data(), static_cast<int>(frame.layout().stride), rect.x, rect.y, rect.width,
                   rect.height, kOpaqueBlack);
}

PixelRect wholeOf(const SharedFrame& frame) {
  return {0, 0, static_cast<int32_t>(frame.layout().width), static_cast<int32_t>(frame.layout().height)};
}

void fillBorders(SharedFrame& frame, const PixelRect& inner) {
  const PixelRect whole = wholeOf(frame);
  const int32_t right = inner.x + inner.width, bottom = inner.y + inner.height;
  fillBlack(frame, {0, 0, whole.width, inner.y});
  fillBlack(frame, {0, bottom, whole.width, whole.height - bottom});
  fillBlack(frame, {0, inner.y, inner.x, inner.height});
  fillBlack(frame, {right, inner.y, whole.width - right, inner.height});
}

/// Where a layer goes in the frame. Its edges are mapped one by one, so that layers that touch
/// on the screen touch in the frame.
PixelRect placeOf(const PictureLayer& layer, const PictureMapping& mapping) {
  const auto mapX = [&](int32_t x) {
    return mapping.target.x + static_cast<int32_t>(std::lround(double(x - mapping.source.x) * mapping.target.width /
                                                               mapping.source.width));
  };
  const auto mapY = [&](int32_t y) {
    return mapping.target.y + static_cast<int32_t>(std::lround(double(y - mapping.source.y) * mapping.target.height /
                                                               mapping.source.height));
  };
  const int32_t left = mapX(layer.x), top = mapY(layer.y);
  return {left, top, mapX(layer.x + layer.area.width) - left, mapY(layer.y + layer.area.height) - top};
}

}  // namespace

PixelRect letterboxed(const PixelRect& source, uint32_t frameWidth, uint32_t frameHeight) {
  const double scale = std::min(double(frameWidth) / source.width, double(frameHeight) / source.height);
  const auto fit = [&](int32_t length, uint32_t limit) {
    return std::clamp(static_cast<int32_t>(std::lround(length * scale)), 1, static_cast<int32_t>(limit));
  };
  const int32_t width = fit(source.width, frameWidth), height = fit(source.height, frameHeight);
  return {(static_cast<int32_t>(frameWidth) - width) / 2, (static_cast<int32_t>(frameHeight) - height) / 2, width,
          height};
}

FrameComposer::Outcome FrameComposer::compose(const std::vector<PictureLayer>& layers, SharedFrame& frame) {
  dropUnusedScratch(layers);
  const PixelRect bounds = boundsOf(layers);
  if (bounds == PixelRect{}) {
    mapping_ = {};
    fillBlack(frame, wholeOf(frame));
    return Outcome::Complete;
  }
  mapping_ = {bounds, letterboxed(bounds, frame.layout().width, frame.layout().height)};
  const PixelRect whole = wholeOf(frame);
  if (layers.size() == 1 && bounds.width == whole.width && bounds.height == whole.height)
    return grabDirectly(layers.front(), frame);
  return grabAndScale(layers, frame);
}

FrameComposer::Outcome FrameComposer::grabDirectly(const PictureLayer& layer, SharedFrame& frame) {
  auto cookie = grabber_.request(layer.drawable, layer.area, frame);
  if (!cookie) return Outcome::NoSharedMemory;
  if (grabber_.finish(*cookie)) return Outcome::Complete;
  fillBlack(frame, wholeOf(frame));
  return Outcome::LayerLost;
}

FrameComposer::Outcome FrameComposer::grabAndScale(const std::vector<PictureLayer>& layers, SharedFrame& frame) {
  std::vector<std::optional<ImageGrabber::Cookie>> cookies;
  for (const auto& layer : layers) {
    SharedFrame* scratch = scratchFor(layer);
    cookies.push_back(scratch ? grabber_.request(layer.drawable, layer.area, *scratch) : std::nullopt);
    if (!cookies.back()) return Outcome::NoSharedMemory;
  }
  if (layers.size() == 1)
    fillBorders(frame, mapping_.target);
  else
    fillBlack(frame, wholeOf(frame));

  Outcome outcome = Outcome::Complete;
  const int stride = static_cast<int>(frame.layout().stride);
  for (size_t i = 0; i < layers.size(); ++i) {
    const PixelRect place = placeOf(layers[i], mapping_);
    uint8_t* target = frame.mutableBytes().data() + size_t{frame.layout().stride} * static_cast<size_t>(place.y) +
                      4 * static_cast<size_t>(place.x);
    if (!grabber_.finish(*cookies[i])) {
      fillBlack(frame, place);
      outcome = Outcome::LayerLost;
      continue;
    }
    if (place.width <= 0 || place.height <= 0) continue;
    const SharedFrame& image = *scratch_.at(layers[i].key);
    const int imageStride = static_cast<int>(image.layout().stride);
    if (!layers[i].hasAlpha || i == 0) {
      libyuv::ARGBScale(image.bytes().data(), imageStride, layers[i].area.width, layers[i].area.height, target, stride,
                        place.width, place.height, libyuv::kFilterBox);
      continue;
    }
    blendRow_.resize(size_t{4} * static_cast<size_t>(place.width) * static_cast<size_t>(place.height));
    libyuv::ARGBScale(image.bytes().data(), imageStride, layers[i].area.width, layers[i].area.height, blendRow_.data(),
                      place.width * 4, place.width, place.height, libyuv::kFilterBox);
    libyuv::ARGBBlend(blendRow_.data(), place.width * 4, target, stride, target, stride, place.width, place.height);
  }
  return outcome;
}

SharedFrame* FrameComposer::scratchFor(const PictureLayer& layer) {
  const FrameLayout layout{static_cast<uint32_t>(layer.area.width), static_cast<uint32_t>(layer.area.height),
                           static_cast<uint32_t>(layer.area.width) * 4, PixelFormat::BGRX};
  auto& scratch = scratch_[layer.key];
  if (scratch && scratch->layout() == layout) return scratch.get();
  if (scratch) grabber_.forget(*scratch);
  scratch = nullptr;
  auto created = SharedFrame::create(layout);
  if (created) scratch = std::move(created.value());
  return scratch.get();
}

void FrameComposer::dropUnusedScratch(const std::vector<PictureLayer>& layers) {
  std::erase_if(scratch_, [&](const auto& entry) {
    const bool used = std::any_of(layers.begin(), layers.end(), [&](const auto& l) { return l.key == entry.first; });
    if (!used && entry.second) grabber_.forget(*entry.second);
    return !used;
  });
}

}  // namespace qv::platform
