#pragma once

#include <xcb/shm.h>
#include <xcb/xcb.h>

#include <array>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>

namespace comet {

/// The game's window: two pictures in memory shared with the X server, shown in turn.
///
/// Draw into `backBuffer`, then `present`. The one given last belongs to the server until it has read
/// it, so the back buffer is empty while the server is behind.
class Window {
 public:
  struct Events {
    std::function<void(char)> key;  ///< a letter
    std::function<void(bool)> active;
    std::function<void()> exposed;
    std::function<void()> closed;
  };

  /// Nothing when there is no usable display.
  static std::unique_ptr<Window> create(uint32_t width, uint32_t height, const char* title, Events events);
  ~Window();
  Window(const Window&) = delete;
  Window& operator=(const Window&) = delete;

  [[nodiscard]] uint32_t identifier() const { return window_; }
  [[nodiscard]] int descriptor() const { return xcb_get_file_descriptor(connection_); }
  [[nodiscard]] std::span<uint32_t> backBuffer();
  void present();
  /// Handles what the server said.
  void dispatch();

 private:
  struct Picture {
    xcb_shm_seg_t segment = 0;
    uint32_t* pixels = nullptr;
    bool inUse = false;  // by the server
  };

  Window(xcb_connection_t* connection, uint32_t width, uint32_t height, Events events);
  bool open(int screenNumber, const char* title);
  void describe(xcb_screen_t* screen, const char* title);
  bool makePicture(Picture& picture);
  void handle(const xcb_generic_event_t& event);
  void takeFocusWithoutManager();
  [[nodiscard]] xcb_atom_t atom(const char* name);
  [[nodiscard]] char letter(xcb_keycode_t code);

  xcb_connection_t* const connection_;
  const uint32_t width_, height_;
  const Events events_;
  xcb_window_t window_ = 0, root_ = 0;
  xcb_gcontext_t context_ = 0;
  xcb_atom_t deleteWindow_ = 0;
  uint8_t shmCompletion_ = 0;
  std::array<Picture, 2> pictures_;
  size_t back_ = 0;
};

}  // namespace comet
