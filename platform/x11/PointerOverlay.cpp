#include "platform/x11/PointerOverlay.h"

#include <libyuv.h>
#include <xcb/xinput.h>

#include <algorithm>
#include <cmath>

namespace qv::platform {

PointerOverlay::PointerOverlay(XcbConnection& connection) : connection_(connection) {
  xcb_connection_t* c = connection_.get();
  cursorEvent_ = xcb_get_extension_data(c, &xcb_xfixes_id)->first_event;
  xcb_xfixes_select_cursor_input(c, connection_.root(), XCB_XFIXES_CURSOR_NOTIFY_MASK_DISPLAY_CURSOR);
  if (!connection_.hasExtension(xcb_input_id)) return;
  if (!connection_.await<xcb_input_xi_query_version_reply_t>(xcb_input_xi_query_version(c, 2, 2))) return;
  inputOpcode_ = xcb_get_extension_data(c, &xcb_input_id)->major_opcode;
  struct {
    xcb_input_event_mask_t head{XCB_INPUT_DEVICE_ALL_MASTER, 1};
    uint32_t events = XCB_INPUT_XI_EVENT_MASK_RAW_MOTION;
  } selection;
  xcb_input_xi_select_events(c, connection_.root(), 1, &selection.head);
}

void PointerOverlay::handleEvent(const xcb_generic_event_t& event) {
  const uint8_t type = event.response_type & 0x7F;
  if (type == cursorEvent_ + XCB_XFIXES_CURSOR_NOTIFY) {
    imageIsStale_ = moved_ = true;
  } else if (type == XCB_GE_GENERIC && inputOpcode_ != 0) {
    const auto& generic = reinterpret_cast<const xcb_ge_generic_event_t&>(event);
    if (generic.extension == inputOpcode_ && generic.event_type == XCB_INPUT_RAW_MOTION) moved_ = true;
  }
}

void PointerOverlay::request() { cookie_ = xcb_query_pointer(connection_.get(), connection_.root()); }

bool PointerOverlay::update(const CaptureSource& source) {
  const Place former = place_;
  const bool imageWasStale = imageIsStale_;
  moved_ = false;
  place_ = {};
  auto pointer = connection_.await<xcb_query_pointer_reply_t>(cookie_);
  if (pointer && pointer->same_screen && source.showsTopLevel(pointer->child))
    place_ = {true, pointer->root_x, pointer->root_y};
  if (place_.isShown && imageIsStale_) readImage();
  return !(place_ == former) || (place_.isShown && imageWasStale);
}

void PointerOverlay::readImage() {
  imageIsStale_ = false;
  image_.clear();
  scale_ = 0;
  auto reply = connection_.await<xcb_xfixes_get_cursor_image_reply_t>(xcb_xfixes_get_cursor_image(connection_.get()));
  if (!reply) return;
  const uint32_t* pixels = xcb_xfixes_get_cursor_image_cursor_image(reply.get());
  image_.assign(pixels, pixels + xcb_xfixes_get_cursor_image_cursor_image_length(reply.get()));
  width_ = reply->width;
  height_ = reply->height;
  hotX_ = reply->xhot;
  hotY_ = reply->yhot;
  const bool isVisible = std::any_of(image_.begin(), image_.end(), [](uint32_t p) { return (p >> 24) != 0; });
  if (!isVisible || image_.size() != static_cast<size_t>(width_) * static_cast<size_t>(height_)) image_.clear();
}

void PointerOverlay::scaleImage(double scale) {
  scale_ = scale;
  scaledWidth_ = std::max(1, static_cast<int32_t>(std::lround(width_ * scale)));
  scaledHeight_ = std::max(1, static_cast<int32_t>(std::lround(height_ * scale)));
  scaled_.resize(static_cast<size_t>(scaledWidth_) * static_cast<size_t>(scaledHeight_));
  libyuv::ARGBScale(reinterpret_cast<const uint8_t*>(image_.data()), width_ * 4, width_, height_,
                    reinterpret_cast<uint8_t*>(scaled_.data()), scaledWidth_ * 4, scaledWidth_, scaledHeight_,
                    libyuv::kFilterBox);
}

void PointerOverlay::draw(const PictureMapping& mapping, SharedFrame& frame) {
  const auto& [source, target] = mapping;
  if (!place_.isShown || image_.empty() || source.width <= 0) return;
  if (place_.x < source.x || place_.x >= source.x + source.width || place_.y < source.y ||
      place_.y >= source.y + source.height)
    return;
  const double scale = double(target.width) / source.width;
  if (scale != scale_) scaleImage(scale);
  const int32_t x = target.x + static_cast<int32_t>(std::lround((place_.x - source.x - hotX_) * scale));
  const int32_t y = target.y + static_cast<int32_t>(std::lround((place_.y - source.y - hotY_) * scale));
  const int32_t left = std::max(x, target.x), top = std::max(y, target.y);
  const int32_t right = std::min(x + scaledWidth_, target.x + target.width);
  const int32_t bottom = std::min(y + scaledHeight_, target.y + target.height);
  if (left >= right || top >= bottom) return;
  const auto* from = reinterpret_cast<const uint8_t*>(scaled_.data() + (top - y) * scaledWidth_ + (left - x));
  const int stride = static_cast<int>(frame.layout().stride);
  uint8_t* to = frame.mutableBytes().data() + static_cast<ptrdiff_t>(stride) * top + 4 * left;
  libyuv::ARGBBlend(from, scaledWidth_ * 4, to, stride, to, stride, right - left, bottom - top);
}

}  // namespace qv::platform
