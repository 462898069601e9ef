#pragma once

#include <string>

#include "platform/UserAlert.h"

namespace qv::platform {

/// Alerts on the X display, by zenity as a child process.
///
/// The button that refuses comes first and takes the Return key: with two buttons that is the
/// later one of default, alternate, other; with three it is the default one. The header is the
/// window's title and the first paragraph of the text. Without a window manager the alert is
/// centred and given the keyboard, which goes back when it ends.
///
/// Threading: thread-safe. One thread per alert that is on the screen; it calls the handler.
class X11UserAlertService final : public UserAlertService {
 public:
  explicit X11UserAlertService(std::string display) : display_(std::move(display)) {}
  /// Nothing without zenity, without the display, or without any button.
  std::unique_ptr<UserAlert> present(const UserAlertRequest& request,
                                     std::function<void(UserAlertAnswer)> handler) override;

 private:
  const std::string display_;
};

}  // namespace qv::platform
