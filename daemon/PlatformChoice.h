#pragma once

#include <memory>

#include "platform/DisplayLayout.h"
#include "platform/Platform.h"
#include "platform/SuspendMonitor.h"

namespace qv {

/// The services of a running daemon: X11 where the display answers, PulseAudio where it answers, and
/// the headless device for whichever is missing; a log line says which. Nothing of it is configured.
///
/// Threading: made and destroyed by the process entry, around everything else.
class PlatformChoice {
 public:
  PlatformChoice();
  ~PlatformChoice();

  [[nodiscard]] platform::Platform& platform() { return platform_; }
  [[nodiscard]] platform::SuspendMonitor& suspendMonitor();
  /// Null without a display.
  [[nodiscard]] std::shared_ptr<platform::DisplayLayoutMonitor> layoutMonitor();

 private:
  struct Backends;
  void chooseScreen();
  void chooseSound();

  std::unique_ptr<Backends> backends_;
  platform::Platform platform_;
};

}  // namespace qv
