#include "tools/quorvelctl/ScreenSize.h"

#include <xcb/xcb.h>

namespace ctl {

std::pair<int, int> screenSize() {
  std::pair<int, int> size{1920, 1080};
  xcb_connection_t* const connection = ::xcb_connect(nullptr, nullptr);
  if (::xcb_connection_has_error(connection) == 0) {
    const auto screens = ::xcb_setup_roots_iterator(::xcb_get_setup(connection));
    if (screens.rem > 0) size = {screens.data->width_in_pixels, screens.data->height_in_pixels};
  }
  ::xcb_disconnect(connection);
  return size;
}

}  // namespace ctl
