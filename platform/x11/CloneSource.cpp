#include "platform/x11/CloneSource.h"

#include <xcb/damage.h>

#include <algorithm>

namespace qv::platform {

CloneSource::CloneSource(XcbConnection& connection, const std::set<uint32_t>& windows)
    : connection_(connection), damageEvent_(xcb_get_extension_data(connection.get(), &xcb_damage_id)->first_event) {
  // Places and order on the screen follow the root's children: the windows themselves, or the
  // frames that a window manager put around them.
  const uint32_t mask = XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY;
  xcb_change_window_attributes(connection.get(), connection.root(), XCB_CW_EVENT_MASK, &mask);
  for (const uint32_t window : windows) windows_.push_back(std::make_unique<ClonedWindow>(connection, window));
}

ClonedWindow* CloneSource::find(xcb_window_t window) {
  auto found = std::find_if(windows_.begin(), windows_.end(), [&](const auto& w) { return w->id() == window; });
  return found == windows_.end() ? nullptr : found->get();
}

void CloneSource::handleEvent(const xcb_generic_event_t& event) {
  const uint8_t type = event.response_type & 0x7F;
  if (type == damageEvent_ + XCB_DAMAGE_NOTIFY) {
    const auto& damage = reinterpret_cast<const xcb_damage_notify_event_t&>(event);
    if (auto* window = find(damage.drawable)) window->setDamaged();
    changed_ = true;
    return;
  }
  switch (type) {
    case XCB_DESTROY_NOTIFY:
      if (auto* window = find(reinterpret_cast<const xcb_destroy_notify_event_t&>(event).window)) window->setGone();
      break;
    case XCB_UNMAP_NOTIFY:
      dropContents(reinterpret_cast<const xcb_unmap_notify_event_t&>(event).window);
      break;
    case XCB_REPARENT_NOTIFY:
      dropContents(reinterpret_cast<const xcb_reparent_notify_event_t&>(event).window);
      break;
    case XCB_MAP_NOTIFY:
    case XCB_CONFIGURE_NOTIFY:
    case XCB_GRAVITY_NOTIFY:
    case XCB_CIRCULATE_NOTIFY:
      break;
    default:
      return;
  }
  placesAreStale_ = changed_ = true;
}

void CloneSource::dropContents(xcb_window_t hidden) {
  for (auto& window : windows_)
    if (window->id() == hidden || window->topLevel() == hidden) window->setUnmapped();
}

const std::vector<PictureLayer>& CloneSource::takeLayers() {
  changed_ = false;
  for (auto& window : windows_) window->clearDamage();
  if (placesAreStale_) readPlaces();
  return layers_;
}

void CloneSource::readPlaces() {
  placesAreStale_ = false;
  layers_.clear();
  for (auto& window : windows_) {
    window->refresh();
    if (window->isUnsupported()) failure_ = kCaptureStatusUnsupportedPixelFormat;
  }
  std::sort(windows_.begin(), windows_.end(),
            [](const auto& a, const auto& b) { return a->stackingPath() < b->stackingPath(); });
  for (auto& window : windows_)
    if (window->layer()) layers_.push_back(*window->layer());
}

bool CloneSource::showsTopLevel(xcb_window_t topLevel) const {
  return topLevel != XCB_NONE && std::any_of(windows_.begin(), windows_.end(), [&](const auto& window) {
           return window->layer() && window->topLevel() == topLevel;
         });
}

}  // namespace qv::platform
