#include "platform/x11/ClonedWindow.h"

#include <xcb/composite.h>
#include <xcb/damage.h>

#include <algorithm>

#include "platform/x11/IndicatorTraces.h"

namespace qv::platform {
namespace {

constexpr int32_t kMaximumSide = 16384;  // of a frame
constexpr int kMaximumDepthOfTree = 32;  // against a tree that changes while it is walked

}  // namespace

ClonedWindow::ClonedWindow(XcbConnection& connection, xcb_window_t window)
    : connection_(connection), window_(window), damage_(xcb_generate_id(connection.get())) {
  // The events are selected first, so that no change after the first look is missed. Each of
  // these requests may meet a window that has just gone: its error is an event nobody reads.
  const uint32_t mask = XCB_EVENT_MASK_STRUCTURE_NOTIFY;
  xcb_change_window_attributes(connection.get(), window, XCB_CW_EVENT_MASK, &mask);
  xcb_composite_redirect_window(connection.get(), window, XCB_COMPOSITE_REDIRECT_AUTOMATIC);
  xcb_damage_create(connection.get(), damage_, window, XCB_DAMAGE_REPORT_LEVEL_NON_EMPTY);
}

ClonedWindow::~ClonedWindow() { releasePixmap(); }

void ClonedWindow::setGone() {
  gone_ = true;
  releasePixmap();
}

void ClonedWindow::clearDamage() {
  if (damaged_ && !gone_) xcb_damage_subtract(connection_.get(), damage_, XCB_NONE, XCB_NONE);
  damaged_ = false;
}

void ClonedWindow::releasePixmap() {
  if (pixmap_ != XCB_NONE) xcb_free_pixmap(connection_.get(), pixmap_);
  pixmap_ = XCB_NONE;
  layer_.reset();
}

void ClonedWindow::refresh() {
  if (gone_) return;
  xcb_connection_t* c = connection_.get();
  const auto attributesCookie = xcb_get_window_attributes(c, window_);
  const auto geometryCookie = xcb_get_geometry(c, window_);
  const auto originCookie = xcb_translate_coordinates(c, window_, connection_.root(), 0, 0);
  auto attributes = connection_.await<xcb_get_window_attributes_reply_t>(attributesCookie);
  auto geometry = connection_.await<xcb_get_geometry_reply_t>(geometryCookie);
  auto origin = connection_.await<xcb_translate_coordinates_reply_t>(originCookie);
  if (!attributes || !geometry || !origin) {
    if (!connection_.isLost()) setGone();
    return;
  }
  const bool isShown =
      attributes->map_state == XCB_MAP_STATE_VIEWABLE && attributes->_class == XCB_WINDOW_CLASS_INPUT_OUTPUT;
  if (!isShown) return releasePixmap();
  unsupported_ = !isPixelFormatSupported(connection_, geometry->depth, attributes->visual);
  if (unsupported_) return releasePixmap();

  const bool isSameSize =
      namedWidth_ == geometry->width && namedHeight_ == geometry->height && namedBorder_ == geometry->border_width;
  if (pixmap_ == XCB_NONE || !isSameSize) namePixmap(geometry->border_width);
  if (pixmap_ == XCB_NONE) return;
  layer_ = PictureLayer{pixmap_, content_, origin->dst_x, origin->dst_y, geometry->depth == 32, window_};
  readStackingPath();
}

void ClonedWindow::namePixmap(uint16_t borderWidth) {
  releasePixmap();
  const xcb_pixmap_t pixmap = xcb_generate_id(connection_.get());
  xcb_composite_name_window_pixmap(connection_.get(), window_, pixmap);
  // The pixmap's own size: it stays what it is, whatever the window does meanwhile.
  auto size = connection_.await<xcb_get_geometry_reply_t>(xcb_get_geometry(connection_.get(), pixmap));
  if (!size) return;
  const int32_t border = borderWidth;
  content_ = {border, border, std::min(size->width - 2 * border, kMaximumSide),
              std::min(size->height - 2 * border, kMaximumSide)};
  pixmap_ = pixmap;
  if (content_.width <= 0 || content_.height <= 0) return releasePixmap();
  namedWidth_ = static_cast<uint16_t>(size->width - 2 * border);
  namedHeight_ = static_cast<uint16_t>(size->height - 2 * border);
  namedBorder_ = borderWidth;
  wipeIndicatorFrom(connection_, window_);
}

void ClonedWindow::readStackingPath() {
  stackingPath_.clear();
  topLevel_ = XCB_NONE;
  auto tree = connection_.await<xcb_query_tree_reply_t>(xcb_query_tree(connection_.get(), window_));
  xcb_window_t child = window_;
  for (int level = 0; tree && tree->parent != XCB_NONE && level < kMaximumDepthOfTree; ++level) {
    const xcb_window_t parent = tree->parent;
    tree = connection_.await<xcb_query_tree_reply_t>(xcb_query_tree(connection_.get(), parent));
    if (!tree) break;
    const xcb_window_t* siblings = xcb_query_tree_children(tree.get());
    const xcb_window_t* end = siblings + xcb_query_tree_children_length(tree.get());
    stackingPath_.push_back(static_cast<size_t>(std::find(siblings, end, child) - siblings));
    topLevel_ = child;
    child = parent;
  }
  std::reverse(stackingPath_.begin(), stackingPath_.end());
}

}  // namespace qv::platform
