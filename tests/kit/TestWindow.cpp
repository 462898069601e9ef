// Shows a window on the display given, writes its id, and stays until it is killed.

#include <unistd.h>
#include <xcb/xcb.h>

#include <cstdlib>

int main(int argc, char** argv) {
  if (argc != 2) return 2;
  xcb_connection_t* connection = xcb_connect(argv[1], nullptr);
  if (xcb_connection_has_error(connection) != 0) return 1;
  const xcb_screen_t* screen = xcb_setup_roots_iterator(xcb_get_setup(connection)).data;
  const xcb_window_t window = xcb_generate_id(connection);
  xcb_create_window(connection, XCB_COPY_FROM_PARENT, window, screen->root, 0, 0, 200, 200, 0,
                    XCB_WINDOW_CLASS_INPUT_OUTPUT, screen->root_visual, 0, nullptr);
  xcb_map_window(connection, window);
  std::free(xcb_get_input_focus_reply(connection, xcb_get_input_focus(connection), nullptr));
  if (::write(STDOUT_FILENO, &window, sizeof window) != sizeof window) return 1;
  while (true) ::pause();
}
