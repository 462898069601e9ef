#include "Window.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <utility>

namespace comet {

namespace {

template <typename T>
struct Free {
  void operator()(T* reply) const { std::free(reply); }
};
template <typename T>
using Reply = std::unique_ptr<T, Free<T>>;

template <typename T>
Reply<T> own(T* reply) {
  return Reply<T>(reply);
}

xcb_screen_t* screenOf(xcb_connection_t* connection, int number) {
  auto it = xcb_setup_roots_iterator(xcb_get_setup(connection));
  for (; it.rem && number > 0; --number) xcb_screen_next(&it);
  return it.rem ? it.data : nullptr;
}

}  // namespace

std::unique_ptr<Window> Window::create(uint32_t width, uint32_t height, const char* title, Events events) {
  int screenNumber = 0;
  xcb_connection_t* connection = xcb_connect(nullptr, &screenNumber);
  // The connection object exists also where connecting failed; the window frees it either way.
  std::unique_ptr<Window> window(new Window(connection, width, height, std::move(events)));
  return window->open(screenNumber, title) ? std::move(window) : nullptr;
}

Window::Window(xcb_connection_t* connection, uint32_t width, uint32_t height, Events events)
    : connection_(connection), width_(width), height_(height), events_(std::move(events)) {}

Window::~Window() {
  for (const Picture& picture : pictures_) {
    if (picture.pixels) ::munmap(picture.pixels, size_t{width_} * height_ * 4);
  }
  xcb_disconnect(connection_);
}

bool Window::open(int screenNumber, const char* title) {
  if (xcb_connection_has_error(connection_)) return false;
  xcb_screen_t* screen = screenOf(connection_, screenNumber);
  const auto* shm = xcb_get_extension_data(connection_, &xcb_shm_id);
  if (!screen || screen->root_depth != 24 || !shm || !shm->present) return false;
  if (!own(xcb_shm_query_version_reply(connection_, xcb_shm_query_version(connection_), nullptr))) return false;
  shmCompletion_ = shm->first_event + XCB_SHM_COMPLETION;
  root_ = screen->root;
  window_ = xcb_generate_id(connection_);
  const uint32_t values[] = {screen->black_pixel, XCB_EVENT_MASK_EXPOSURE | XCB_EVENT_MASK_KEY_PRESS |
                                                      XCB_EVENT_MASK_STRUCTURE_NOTIFY | XCB_EVENT_MASK_FOCUS_CHANGE};
  xcb_create_window(connection_, screen->root_depth, window_, root_, 0, 0, width_, height_, 0,
                    XCB_WINDOW_CLASS_INPUT_OUTPUT, screen->root_visual, XCB_CW_BACK_PIXEL | XCB_CW_EVENT_MASK, values);
  context_ = xcb_generate_id(connection_);
  xcb_create_gc(connection_, context_, window_, 0, nullptr);
  describe(screen, title);
  for (Picture& picture : pictures_) {
    if (!makePicture(picture)) return false;
  }
  xcb_map_window(connection_, window_);
  xcb_flush(connection_);
  return true;
}

/// Tells the window manager who we are, and that the size is fixed.
void Window::describe(xcb_screen_t*, const char* title) {
  const auto set = [this](xcb_atom_t property, xcb_atom_t type, uint8_t format, uint32_t length, const void* data) {
    xcb_change_property(connection_, XCB_PROP_MODE_REPLACE, window_, property, type, format, length, data);
  };
  set(XCB_ATOM_WM_NAME, XCB_ATOM_STRING, 8, std::strlen(title), title);
  const uint32_t pid = ::getpid();
  set(atom("_NET_WM_PID"), XCB_ATOM_CARDINAL, 32, 1, &pid);
  deleteWindow_ = atom("WM_DELETE_WINDOW");
  set(atom("WM_PROTOCOLS"), XCB_ATOM_ATOM, 32, 1, &deleteWindow_);
  constexpr uint32_t kMinimumAndMaximumSize = 1u << 4 | 1u << 5;
  const uint32_t hints[18] = {kMinimumAndMaximumSize, 0, 0, 0, 0, width_, height_, width_, height_};
  set(XCB_ATOM_WM_NORMAL_HINTS, XCB_ATOM_WM_SIZE_HINTS, 32, 18, hints);
}

bool Window::makePicture(Picture& picture) {
  const size_t size = size_t{width_} * height_ * 4;
  const int memory = ::memfd_create("comet picture", MFD_CLOEXEC | MFD_ALLOW_SEALING);
  if (memory < 0) return false;
  void* pixels = MAP_FAILED;
  if (::ftruncate(memory, static_cast<off_t>(size)) == 0)
    pixels = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, memory, 0);
  if (pixels == MAP_FAILED) {
    ::close(memory);
    return false;
  }
  picture.pixels = static_cast<uint32_t*>(pixels);
  picture.segment = xcb_generate_id(connection_);
  // The descriptor is the connection's from here on.
  const auto attached = xcb_shm_attach_fd_checked(connection_, picture.segment, memory, 1);
  return !own(xcb_request_check(connection_, attached));
}

std::span<uint32_t> Window::backBuffer() {
  const Picture& picture = pictures_[back_];
  if (picture.inUse) return {};
  return {picture.pixels, size_t{width_} * height_};
}

void Window::present() {
  Picture& picture = pictures_[back_];
  picture.inUse = true;
  constexpr uint8_t kTellWhenRead = 1;
  xcb_shm_put_image(connection_, window_, context_, width_, height_, 0, 0, width_, height_, 0, 0, 24,
                    XCB_IMAGE_FORMAT_Z_PIXMAP, kTellWhenRead, picture.segment, 0);
  xcb_flush(connection_);
  back_ = 1 - back_;
}

void Window::dispatch() {
  while (const auto event = own(xcb_poll_for_event(connection_))) handle(*event);
  if (xcb_connection_has_error(connection_)) events_.closed();
}

void Window::handle(const xcb_generic_event_t& event) {
  const uint8_t type = event.response_type & 0x7f;
  if (type == shmCompletion_) {
    const auto& done = reinterpret_cast<const xcb_shm_completion_event_t&>(event);
    for (Picture& picture : pictures_) {
      if (picture.segment == done.shmseg) picture.inUse = false;
    }
  } else if (type == XCB_MAP_NOTIFY) {
    takeFocusWithoutManager();
  } else if (type == XCB_EXPOSE) {
    events_.exposed();
  } else if (type == XCB_FOCUS_IN || type == XCB_FOCUS_OUT) {
    // A grab of the keyboard, e.g. for a hot key, does not take us from the front, and the pointer
    // resting on us does not bring us there.
    const auto& focus = reinterpret_cast<const xcb_focus_in_event_t&>(event);
    const bool ofWindow = focus.detail != XCB_NOTIFY_DETAIL_POINTER && focus.detail != XCB_NOTIFY_DETAIL_POINTER_ROOT;
    const bool ofGrab = focus.mode == XCB_NOTIFY_MODE_GRAB || focus.mode == XCB_NOTIFY_MODE_UNGRAB;
    if (ofWindow && !ofGrab) events_.active(type == XCB_FOCUS_IN);
  } else if (type == XCB_KEY_PRESS) {
    events_.key(letter(reinterpret_cast<const xcb_key_press_event_t&>(event).detail));
  } else if (type == XCB_CLIENT_MESSAGE) {
    if (reinterpret_cast<const xcb_client_message_event_t&>(event).data.data32[0] == deleteWindow_) events_.closed();
  }
}

/// A window manager gives the focus by itself; on a bare server nobody else does.
void Window::takeFocusWithoutManager() {
  const auto property =
      xcb_get_property(connection_, 0, root_, atom("_NET_SUPPORTING_WM_CHECK"), XCB_ATOM_WINDOW, 0, 1);
  const auto manager = own(xcb_get_property_reply(connection_, property, nullptr));
  if (manager && manager->value_len > 0) return;
  xcb_set_input_focus(connection_, XCB_INPUT_FOCUS_POINTER_ROOT, window_, XCB_CURRENT_TIME);
  xcb_flush(connection_);
}

xcb_atom_t Window::atom(const char* name) {
  const auto request = xcb_intern_atom(connection_, 0, std::strlen(name), name);
  const auto reply = own(xcb_intern_atom_reply(connection_, request, nullptr));
  return reply ? reply->atom : static_cast<xcb_atom_t>(XCB_ATOM_NONE);
}

char Window::letter(xcb_keycode_t code) {
  const auto request = xcb_get_keyboard_mapping(connection_, code, 1);
  const auto reply = own(xcb_get_keyboard_mapping_reply(connection_, request, nullptr));
  if (!reply || xcb_get_keyboard_mapping_keysyms_length(reply.get()) == 0) return 0;
  const xcb_keysym_t symbol = xcb_get_keyboard_mapping_keysyms(reply.get())[0];
  return symbol < 0x80 ? static_cast<char>(symbol) : 0;
}

}  // namespace comet
