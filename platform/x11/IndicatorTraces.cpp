#include "platform/x11/IndicatorTraces.h"

#include <algorithm>
#include <optional>
#include <vector>

namespace qv::platform {
namespace {

constexpr size_t kMostWindows = 256;  // within one that is captured

/// On the root window.
struct Area {
  int left = 0, top = 0, right = 0, bottom = 0;
};

std::optional<Area> areaOf(XcbConnection& connection, xcb_window_t window) {
  const auto attributesCookie = xcb_get_window_attributes(connection.get(), window);
  const auto geometryCookie = xcb_get_geometry(connection.get(), window);
  const auto originCookie = xcb_translate_coordinates(connection.get(), window, connection.root(), 0, 0);
  auto attributes = connection.await<xcb_get_window_attributes_reply_t>(attributesCookie);
  auto geometry = connection.await<xcb_get_geometry_reply_t>(geometryCookie);
  auto origin = connection.await<xcb_translate_coordinates_reply_t>(originCookie);
  if (!attributes || !geometry || !origin) return std::nullopt;
  if (attributes->map_state != XCB_MAP_STATE_VIEWABLE || attributes->_class != XCB_WINDOW_CLASS_INPUT_OUTPUT)
    return std::nullopt;
  return Area{origin->dst_x, origin->dst_y, origin->dst_x + geometry->width, origin->dst_y + geometry->height};
}

/// Black where the window has no background.
void wipe(XcbConnection& connection, xcb_window_t window, const Area& own, const Area& indicator) {
  const Area common{std::max(own.left, indicator.left), std::max(own.top, indicator.top),
                    std::min(own.right, indicator.right), std::min(own.bottom, indicator.bottom)};
  if (common.left >= common.right || common.top >= common.bottom) return;
  const xcb_rectangle_t part{static_cast<int16_t>(common.left - own.left), static_cast<int16_t>(common.top - own.top),
                             static_cast<uint16_t>(common.right - common.left),
                             static_cast<uint16_t>(common.bottom - common.top)};
  const xcb_gcontext_t black = xcb_generate_id(connection.get());
  const uint32_t color = 0;
  xcb_create_gc(connection.get(), black, window, XCB_GC_FOREGROUND, &color);
  xcb_poly_fill_rectangle(connection.get(), window, black, 1, &part);
  xcb_free_gc(connection.get(), black);
  constexpr uint8_t kTellsTheApplication = 1;
  xcb_clear_area(connection.get(), kTellsTheApplication, window, part.x, part.y, part.width, part.height);
}

}  // namespace

void wipeIndicatorFrom(XcbConnection& connection, xcb_window_t window) {
  const xcb_window_t shown =
      connection.property32(connection.root(), connection.atom(kIndicatorProperty), XCB_ATOM_WINDOW);
  const auto indicator = shown == XCB_NONE ? std::nullopt : areaOf(connection, shown);
  if (!indicator) return;
  std::vector<xcb_window_t> windows{window};
  for (size_t i = 0; i < windows.size() && i < kMostWindows; ++i) {
    const auto own = areaOf(connection, windows[i]);
    if (!own) continue;
    wipe(connection, windows[i], *own, *indicator);
    auto tree = connection.await<xcb_query_tree_reply_t>(xcb_query_tree(connection.get(), windows[i]));
    if (!tree) continue;
    const xcb_window_t* children = xcb_query_tree_children(tree.get());
    windows.insert(windows.end(), children, children + xcb_query_tree_children_length(tree.get()));
  }
}

}  // namespace qv::platform
