// Screen: a device's own interface to recordings of the whole screen. SystemUI.cpp shows the use of the library.

#include <xcb/xcb.h>

#include <cstdio>
#include <cstring>

#include "SystemUI.h"

namespace {

/// Of the display's first screen; that of a television where there is no display.
screen::ScreenSize sizeOfScreen() {
  screen::ScreenSize size{1920, 1080};
  xcb_connection_t* connection = xcb_connect(nullptr, nullptr);
  if (!xcb_connection_has_error(connection)) {
    const auto roots = xcb_setup_roots_iterator(xcb_get_setup(connection));
    if (roots.rem > 0) size = {double(roots.data->width_in_pixels), double(roots.data->height_in_pixels)};
  }
  xcb_disconnect(connection);
  return size;
}

}  // namespace

int main(int argc, char** argv) {
  screen::ScreenSize size = sizeOfScreen();
  const bool hasSize = argc == 3 && std::strcmp(argv[1], "--size") == 0 &&
                       std::sscanf(argv[2], "%lfx%lf", &size.width, &size.height) == 2;
  if (argc != 1 && !hasSize) {
    std::fprintf(stderr, "usage: quorvel-example-system-ui [--size WxH]\n");
    return 2;
  }
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  comet::MainLoop loop;
  screen::SystemUI ui(loop, size);
  loop.run();
  return 0;
}
