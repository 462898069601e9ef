#pragma once

#include <sys/types.h>

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/Applications.h"
#include "platform/DisplayLayout.h"
#include "platform/RenderServer.h"
#include "platform/ScreenCapture.h"
#include "platform/StatusBar.h"
#include "platform/UserAlert.h"
#include "platform/base/Result.h"
#include "platform/threads/Clock.h"

namespace qv::platform {

struct X11Dependencies {
  /// The bundle identifier of a process; nothing for one that belongs to no bundle. Called on any
  /// thread.
  std::function<std::optional<std::string>(pid_t)> bundleIdentifierOfProcess = nullptr;
  Clock* clock = &systemClock();
  /// Where the module of the indicator stands, as for pathOfModule.
  std::filesystem::path moduleDirectory = {};
};

/// The services of an X server (MIT-SHM 1.2, Composite 0.2, DAMAGE, XFIXES 2, X-Resource 1.2;
/// XInput 2 where present).
///
/// A layer context is a window id. The server may go away and come back: what is in progress
/// fails, later calls connect anew.
///
/// Threading: thread-safe. Destroyed after everything that its services made.
class X11Platform {
 public:
  /// Fails when the display (empty: that of $DISPLAY) does not answer.
  static Result<std::unique_ptr<X11Platform>> connect(const std::string& display, X11Dependencies dependencies);
  ~X11Platform();
  X11Platform(const X11Platform&) = delete;
  X11Platform& operator=(const X11Platform&) = delete;

  ScreenCaptureService& screenCapture();
  ApplicationService& applications();
  RenderServer& renderServer();
  UserAlertService& alerts();
  StatusBarOverrideCoordinator& statusBar();
  std::shared_ptr<DisplayLayoutMonitor> createLayoutMonitor();
  /// Nothing where the server answers now. It is asked by a connection of its own.
  [[nodiscard]] std::optional<Error> whyNotThere() const;

 private:
  struct Services;
  explicit X11Platform(std::unique_ptr<Services> services);
  const std::unique_ptr<Services> services_;
};

}  // namespace qv::platform
