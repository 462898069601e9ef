#pragma once

#include <sys/types.h>

#include <memory>

#include "platform/x11/XcbConnection.h"

namespace qv::platform {

/// Gives an alert's window the keyboard. A window manager is asked to activate it, and gives the
/// keyboard back by itself. Without one the window is put in the middle and given the keyboard,
/// which goes back when this is destroyed.
///
/// Threading: used by one thread at a time.
class AlertFocus {
 public:
  /// From here on windows that appear are seen.
  explicit AlertFocus(std::unique_ptr<XcbConnection> connection);
  ~AlertFocus();
  AlertFocus(const AlertFocus&) = delete;
  AlertFocus& operator=(const AlertFocus&) = delete;
  /// Readable when `handleEvents` is due; -1 when the server has gone.
  [[nodiscard]] int fd() const { return connection_->isLost() ? -1 : connection_->fd(); }
  void handleEvents(pid_t alertProcess);

 private:
  void askForActivation(xcb_window_t window);
  void windowAppeared(xcb_window_t window, pid_t alertProcess);
  void restore();

  std::unique_ptr<XcbConnection> connection_;
  bool hasTaken_ = false;
  pid_t alertProcess_ = -1;
  xcb_window_t formerFocus_ = XCB_INPUT_FOCUS_POINTER_ROOT;
};

}  // namespace qv::platform
