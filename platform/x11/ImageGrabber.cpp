#include "platform/x11/ImageGrabber.h"

#include <fcntl.h>

namespace qv::platform {

xcb_shm_seg_t ImageGrabber::segmentOf(const SharedFrame& frame) {
  auto known = segments_.find(frame.memory().get());
  if (known != segments_.end()) return known->second.id;
  const int sent = ::fcntl(frame.memory()->get(), F_DUPFD_CLOEXEC, 0);  // closed by libxcb once it is sent
  if (sent < 0) return XCB_NONE;
  const xcb_shm_seg_t id = xcb_generate_id(connection_.get());
  if (!connection_.succeeded(xcb_shm_attach_fd_checked(connection_.get(), id, sent, 0))) return XCB_NONE;
  segments_[frame.memory().get()] = {frame.memory(), id};
  return id;
}

std::optional<ImageGrabber::Cookie> ImageGrabber::request(xcb_drawable_t drawable, const PixelRect& area,
                                                          SharedFrame& frame) {
  const xcb_shm_seg_t segment = segmentOf(frame);
  if (segment == XCB_NONE) return std::nullopt;
  return xcb_shm_get_image(connection_.get(), drawable, static_cast<int16_t>(area.x), static_cast<int16_t>(area.y),
                           static_cast<uint16_t>(area.width), static_cast<uint16_t>(area.height), ~0u,
                           XCB_IMAGE_FORMAT_Z_PIXMAP, segment, 0);
}

void ImageGrabber::forget(const SharedFrame& frame) {
  auto known = segments_.find(frame.memory().get());
  if (known == segments_.end()) return;
  xcb_shm_detach(connection_.get(), known->second.id);
  segments_.erase(known);
}

}  // namespace qv::platform
