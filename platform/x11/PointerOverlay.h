#pragma once

#include <xcb/xfixes.h>

#include <vector>

#include "platform/x11/CaptureSource.h"

namespace qv::platform {

/// Draws the pointer into pictures.
///
/// The server tells of motion and of new pointer images, so a resting pointer costs nothing. Where
/// it is, is asked with each picture (`request` before the grab, `draw` after it: one wait for
/// both); its image only when that has changed.
///
/// Threading: the capture thread.
class PointerOverlay {
 public:
  explicit PointerOverlay(XcbConnection& connection);
  void handleEvent(const xcb_generic_event_t& event);
  /// Whether the pointer may look different, or be elsewhere, than in the last picture.
  [[nodiscard]] bool hasMoved() const { return moved_; }
  /// Asks where the pointer is.
  void request();
  /// Answers whether what `draw` would draw differs from the last picture, taking the answer to
  /// `request`.
  bool update(const CaptureSource& source);
  /// Draws the pointer at the place known from `update`.
  void draw(const PictureMapping& mapping, SharedFrame& frame);

 private:
  struct Place {
    bool isShown = false;
    int32_t x = 0, y = 0;  // of the hot spot, on the root window
    bool operator==(const Place&) const = default;
  };
  void readImage();
  void scaleImage(double scale);

  XcbConnection& connection_;
  uint8_t cursorEvent_ = 0;
  uint8_t inputOpcode_ = 0;  // 0 without the extension
  bool moved_ = true;
  bool imageIsStale_ = true;
  xcb_query_pointer_cookie_t cookie_{};
  Place place_;
  std::vector<uint32_t> image_;   // premultiplied, as the server gives it
  std::vector<uint32_t> scaled_;  // for the picture's scale
  int32_t width_ = 0, height_ = 0, hotX_ = 0, hotY_ = 0;
  int32_t scaledWidth_ = 0, scaledHeight_ = 0;
  double scale_ = 0;
};

}  // namespace qv::platform
