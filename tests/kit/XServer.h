#pragma once

#include <gtest/gtest.h>
#include <xcb/xcb.h>

#include <cstdint>
#include <functional>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>

#include "tests/kit/Process.h"

namespace qv::kit {

/// An X server without hardware, 640 x 480.
///
/// Threading: one thread.
class XServer {
 public:
  static constexpr uint16_t kWidth = 640, kHeight = 480;
  XServer();
  [[nodiscard]] const std::string& display() const { return display_; }
  void kill() { process_.kill(); }

 private:
  Process process_;
  std::string display_;
};

/// A client of the X server, that shows windows of plain colours. Every call is complete in the
/// server when it returns.
///
/// Threading: one thread.
class XClient {
 public:
  explicit XClient(const std::string& display);
  ~XClient();
  XClient(const XClient&) = delete;
  XClient& operator=(const XClient&) = delete;
  struct WindowOptions {
    int16_t x = 0, y = 0;
    uint16_t width = 100, height = 80;
    uint32_t color = 0;
    bool hasAlpha = false;  ///< `color` then carries premultiplied alpha
    xcb_window_t parent = XCB_NONE;
    uint16_t border = 0;
  };
  /// Mapped, filled with its colour.
  xcb_window_t show(const WindowOptions& options);
  void fill(xcb_window_t window, uint32_t color);
  void fillRect(xcb_window_t window, uint32_t color, int16_t x, int16_t y, uint16_t width, uint16_t height);
  void setNoBackground(xcb_window_t window);
  void resize(xcb_window_t window, uint16_t width, uint16_t height);
  void move(xcb_window_t window, int16_t x, int16_t y);
  void raise(xcb_window_t window);
  void unmap(xcb_window_t window);
  void map(xcb_window_t window);
  void destroy(xcb_window_t window);
  void focus(xcb_window_t window);
  /// The window that has the keyboard focus.
  [[nodiscard]] xcb_window_t focused();
  /// Returns when the window exists no more.
  void waitForEnd(xcb_window_t window);
  /// A property of text or plain bytes; empty where the window has none.
  std::string property(xcb_window_t window, const char* name);
  /// Returns when a window of this title, or one within it, has the focus.
  xcb_window_t waitForFocusedWindow(const std::string& title);
  /// Returns when this window, or one within it, has the focus.
  void waitForFocus(xcb_window_t wanted);
  void setCursor(xcb_window_t window, uint16_t side, uint32_t rgb);
  [[nodiscard]] xcb_window_t root() const { return screen_->root; }
  void sync();

 private:
  void configure(xcb_window_t window, uint16_t mask, std::initializer_list<uint32_t> values);
  void waitForEvent();
  void select(xcb_window_t window, uint32_t mask);
  void selectFocusEvents();
  xcb_window_t waitForFocus(const std::function<bool(xcb_window_t)>& isWanted);
  xcb_window_t parentOf(xcb_window_t window);

  xcb_connection_t* connection_;
  xcb_screen_t* screen_;
};

/// A window manager (openbox) on a display, that is up when the constructor returns. It takes no notice of what it is
/// sent while it comes up until something else wakes it.
///
/// Threading: one thread.
class WindowManager {
 public:
  explicit WindowManager(const std::string& display);
  /// Returns when it and its windows are gone.
  void kill();

 private:
  XClient client_;
  Process process_;
  xcb_window_t window_ = XCB_NONE;
};

/// Lets the window manager activate a window, and waits until it has.
bool activateWindow(const std::string& display, xcb_window_t window);
/// Presses keys on a display, one after the other.
bool pressKeys(const std::string& display, std::initializer_list<const char*> keys);

/// A process of its own that shows one window, 200 x 200, until it is killed.
///
/// Threading: one thread.
class WindowProcess {
 public:
  explicit WindowProcess(const std::string& display);
  void kill() { process_.kill(); }
  [[nodiscard]] pid_t pid() const { return pid_; }
  [[nodiscard]] xcb_window_t window() const { return window_; }

 private:
  Process process_;
  const pid_t pid_ = process_.pid();
  xcb_window_t window_ = 0;
};

/// Skips, visibly, where there is no X server to start. One server per suite.
///
/// Threading: one thread.
class XServerTest : public ::testing::Test {
 protected:
  static void TearDownTestSuite() { server_.reset(); }
  void SetUp() override;
  static const std::string& display() { return server_->display(); }

 private:
  static inline std::optional<XServer> server_;
};

}  // namespace qv::kit
