#include "platform/x11/ScreenSource.h"

#include <xcb/damage.h>

#include <algorithm>

namespace qv::platform {
namespace {

constexpr int32_t kMaximumSide = 16384;  // of a frame

}  // namespace

bool isPixelFormatSupported(XcbConnection& connection, uint8_t depth, xcb_visualid_t visual) {
  const xcb_setup_t& setup = connection.setup();
  if ((depth != 24 && depth != 32) || setup.image_byte_order != XCB_IMAGE_ORDER_LSB_FIRST) return false;
  const xcb_format_t* formats = xcb_setup_pixmap_formats(&setup);
  const bool has32Bits = std::any_of(formats, formats + xcb_setup_pixmap_formats_length(&setup),
                                     [&](const auto& f) { return f.depth == depth && f.bits_per_pixel == 32; });
  if (!has32Bits) return false;
  for (auto screen = xcb_setup_roots_iterator(&setup); screen.rem > 0; xcb_screen_next(&screen))
    for (auto depths = xcb_screen_allowed_depths_iterator(screen.data); depths.rem > 0; xcb_depth_next(&depths))
      for (auto type = xcb_depth_visuals_iterator(depths.data); type.rem > 0; xcb_visualtype_next(&type))
        if (type.data->visual_id == visual)
          return type.data->red_mask == 0xFF0000 && type.data->green_mask == 0xFF00 && type.data->blue_mask == 0xFF;
  return false;
}

ScreenSource::ScreenSource(XcbConnection& connection)
    : connection_(connection),
      damage_(xcb_generate_id(connection.get())),
      damageEvent_(xcb_get_extension_data(connection.get(), &xcb_damage_id)->first_event) {
  const uint32_t mask = XCB_EVENT_MASK_STRUCTURE_NOTIFY;
  xcb_change_window_attributes(connection.get(), connection.root(), XCB_CW_EVENT_MASK, &mask);
  xcb_damage_create(connection.get(), damage_, connection.root(), XCB_DAMAGE_REPORT_LEVEL_NON_EMPTY);
  auto attributes = connection.await<xcb_get_window_attributes_reply_t>(
      xcb_get_window_attributes(connection.get(), connection.root()));
  auto geometry = connection.await<xcb_get_geometry_reply_t>(xcb_get_geometry(connection.get(), connection.root()));
  if (attributes && geometry && !isPixelFormatSupported(connection, geometry->depth, attributes->visual))
    failure_ = kCaptureStatusUnsupportedPixelFormat;
}

void ScreenSource::handleEvent(const xcb_generic_event_t& event) {
  const uint8_t type = event.response_type & 0x7F;
  if (type == damageEvent_ + XCB_DAMAGE_NOTIFY)
    changed_ = damaged_ = true;
  else if (type == XCB_CONFIGURE_NOTIFY)
    changed_ = sizeIsStale_ = true;
}

const std::vector<PictureLayer>& ScreenSource::takeLayers() {
  changed_ = false;
  if (damaged_) xcb_damage_subtract(connection_.get(), damage_, XCB_NONE, XCB_NONE);
  damaged_ = false;
  if (sizeIsStale_) readSize();
  return layers_;
}

void ScreenSource::readSize() {
  sizeIsStale_ = false;
  layers_.clear();
  auto geometry = connection_.await<xcb_get_geometry_reply_t>(xcb_get_geometry(connection_.get(), connection_.root()));
  if (!geometry) return;
  PictureLayer layer;
  layer.drawable = layer.key = connection_.root();
  layer.area = {0, 0, std::min<int32_t>(geometry->width, kMaximumSide),
                std::min<int32_t>(geometry->height, kMaximumSide)};
  layers_.push_back(layer);
}

}  // namespace qv::platform
