#pragma once

#include "platform/x11/CaptureSource.h"

namespace qv::platform {

/// One window of another client, with its off-screen contents.
///
/// While the object lives the server keeps the window's contents apart from the screen's, so
/// that they can be read where other windows cover them. A pixmap names these contents as long
/// as the window neither changes its size nor is unmapped; afterwards the pixmap stays readable
/// but frozen, and nothing but the window's events tells. So they are followed.
///
/// Threading: the capture thread.
class ClonedWindow {
 public:
  ClonedWindow(XcbConnection& connection, xcb_window_t window);
  ~ClonedWindow();
  ClonedWindow(const ClonedWindow&) = delete;
  ClonedWindow& operator=(const ClonedWindow&) = delete;

  [[nodiscard]] xcb_window_t id() const { return window_; }
  /// For ever: its id may later name another client's window.
  void setGone();
  void setUnmapped() { releasePixmap(); }
  void setDamaged() { damaged_ = true; }
  /// Changes after this are reported as new damage.
  void clearDamage();
  /// Looks at size, place and state anew. Some round trips.
  void refresh();

  /// What to grab; nothing while the window is not shown.
  [[nodiscard]] const std::optional<PictureLayer>& layer() const { return layer_; }
  [[nodiscard]] bool isUnsupported() const { return unsupported_; }
  [[nodiscard]] xcb_window_t topLevel() const { return topLevel_; }
  /// The window's place in the stacking order: positions among siblings, from the root down.
  [[nodiscard]] const std::vector<size_t>& stackingPath() const { return stackingPath_; }

 private:
  void releasePixmap();
  void namePixmap(uint16_t borderWidth);
  void readStackingPath();

  XcbConnection& connection_;
  const xcb_window_t window_;
  uint32_t damage_;
  bool damaged_ = true;
  bool gone_ = false;
  bool unsupported_ = false;
  xcb_pixmap_t pixmap_ = XCB_NONE;
  PixelRect content_;  // of the pixmap, without the window's border
  uint16_t namedWidth_ = 0, namedHeight_ = 0, namedBorder_ = 0;
  std::optional<PictureLayer> layer_;
  xcb_window_t topLevel_ = XCB_NONE;
  std::vector<size_t> stackingPath_;
};

}  // namespace qv::platform
