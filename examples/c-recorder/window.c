#include "window.h"

#include <math.h>
#include <stdlib.h>
#include <xcb/xcb.h>

struct window {
  xcb_connection_t* connection;
  xcb_window_t id;
  xcb_gcontext_t context;
  uint16_t width, height;
  bool active;
};

struct window* window_open(uint16_t width, uint16_t height) {
  xcb_connection_t* connection = xcb_connect(NULL, NULL);
  if (xcb_connection_has_error(connection)) {
    xcb_disconnect(connection);
    return NULL;
  }
  struct window* window = calloc(1, sizeof *window);
  if (window == NULL) abort();
  const xcb_screen_t* screen = xcb_setup_roots_iterator(xcb_get_setup(connection)).data;
  window->connection = connection;
  window->width = width;
  window->height = height;
  window->id = xcb_generate_id(connection);
  window->context = xcb_generate_id(connection);
  const uint32_t values[] = {screen->black_pixel, XCB_EVENT_MASK_STRUCTURE_NOTIFY | XCB_EVENT_MASK_FOCUS_CHANGE};
  xcb_create_window(connection, XCB_COPY_FROM_PARENT, window->id, screen->root, 0, 0, width, height, 0,
                    XCB_WINDOW_CLASS_INPUT_OUTPUT, screen->root_visual, XCB_CW_BACK_PIXEL | XCB_CW_EVENT_MASK, values);
  xcb_create_gc(connection, window->context, window->id, 0, NULL);
  const char title[] = "Square Dance";
  xcb_change_property(connection, XCB_PROP_MODE_REPLACE, window->id, XCB_ATOM_WM_NAME, XCB_ATOM_STRING, 8,
                      sizeof title - 1, title);
  xcb_map_window(connection, window->id);
  xcb_flush(connection);
  return window;
}

void window_close(struct window* window) {
  if (window == NULL) return;
  xcb_disconnect(window->connection);
  free(window);
}

uint32_t window_identifier(const struct window* window) { return window->id; }
bool window_is_active(const struct window* window) { return window->active; }

void window_draw(struct window* window, double seconds) {
  const uint16_t side = window->height / 4;
  const xcb_rectangle_t whole = {0, 0, window->width, window->height};
  const xcb_rectangle_t square = {(int16_t)((window->width - side) * (0.5 + 0.4 * cos(seconds))),
                                  (int16_t)((window->height - side) * (0.5 + 0.4 * sin(seconds))), side, side};
  const uint32_t colours[] = {0x203040, 0xffc040};
  xcb_change_gc(window->connection, window->context, XCB_GC_FOREGROUND, &colours[0]);
  xcb_poly_fill_rectangle(window->connection, window->id, window->context, 1, &whole);
  xcb_change_gc(window->connection, window->context, XCB_GC_FOREGROUND, &colours[1]);
  xcb_poly_fill_rectangle(window->connection, window->id, window->context, 1, &square);
  xcb_flush(window->connection);
}

bool window_dispatch(struct window* window) {
  xcb_generic_event_t* event = NULL;
  while ((event = xcb_poll_for_event(window->connection)) != NULL) {
    const uint8_t type = event->response_type & 0x7f;
    if (type == XCB_FOCUS_IN || type == XCB_FOCUS_OUT) window->active = type == XCB_FOCUS_IN;
    /* A window manager gives the focus by itself; on a bare server nobody else does. */
    if (type == XCB_MAP_NOTIFY)
      xcb_set_input_focus(window->connection, XCB_INPUT_FOCUS_POINTER_ROOT, window->id, XCB_CURRENT_TIME);
    free(event);
  }
  xcb_flush(window->connection);
  return !xcb_connection_has_error(window->connection);
}
