#pragma once

#include <xcb/shm.h>

#include <map>
#include <optional>

#include "platform/base/SharedFrame.h"
#include "platform/x11/XcbConnection.h"

namespace qv::platform {

/// A rectangle in pixels.
struct PixelRect {
  int32_t x = 0, y = 0, width = 0, height = 0;
  bool operator==(const PixelRect&) const = default;
};

/// Has the server write images straight into frames: no pixel crosses the socket or is copied here.
///
/// A frame's memory file is attached to the server the first time it is used, and stays attached
/// until `forget` or the end of the connection; a bounded pool of frames keeps that small.
///
/// Threading: the connection's thread.
class ImageGrabber {
 public:
  using Cookie = xcb_shm_get_image_cookie_t;

  explicit ImageGrabber(XcbConnection& connection) : connection_(connection) {}
  /// Asks for `area` of `drawable` at the beginning of the frame's memory, area.width * 4 bytes a
  /// row. Nothing when the server refused to attach the memory.
  std::optional<Cookie> request(xcb_drawable_t drawable, const PixelRect& area, SharedFrame& frame);
  /// Waits for the image; false when the server could not give it.
  bool finish(Cookie cookie) { return connection_.await<xcb_shm_get_image_reply_t>(cookie) != nullptr; }
  /// Detaches a frame that will not be used again.
  void forget(const SharedFrame& frame);

 private:
  struct Segment {
    SharedFileDescriptor memory;  // keeps the key from being reused
    xcb_shm_seg_t id = 0;
  };
  xcb_shm_seg_t segmentOf(const SharedFrame& frame);

  XcbConnection& connection_;
  std::map<const FileDescriptor*, Segment> segments_;
};

}  // namespace qv::platform
