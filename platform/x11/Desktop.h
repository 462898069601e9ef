#pragma once

#include <sys/types.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/x11/XcbConnection.h"

namespace qv::platform {

using BundleLookup = std::function<std::optional<std::string>(pid_t)>;

/// The windows' processes at one moment, and which of them is in front.
struct DesktopSnapshot {
  bool hasWindowManager = false;
  /// Owners of top-level windows, topmost first, each once.
  std::vector<pid_t> processes;
  /// The owner of the active window, or of the window that has the keyboard focus.
  std::optional<pid_t> front;
  /// Nobody manages windows and no window has the focus: then whatever application is topmost is
  /// in front. These are the owners of visible top-level windows, topmost first.
  std::vector<pid_t> frontCandidates;
  /// The children of the root window.
  std::vector<xcb_window_t> topLevels;
};

/// The window by which a living window manager shows itself; XCB_NONE without one.
xcb_window_t windowManagerCheck(XcbConnection& connection);

/// Some round trips. With `selectFocusEvents`, changes of the focus between top-level windows will
/// be told to this connection.
DesktopSnapshot readDesktop(XcbConnection& connection, bool selectFocusEvents);

/// A process that shows windows and belongs to a bundle.
struct RunningApplication {
  pid_t pid = 0;
  std::string bundleID;
  bool isFrontmost = false;  ///< of one at most
};

/// The applications among a snapshot's processes, topmost first. A front process that belongs to
/// no bundle leaves nobody in front.
std::vector<RunningApplication> applicationsOf(const DesktopSnapshot& desktop, const BundleLookup& bundleOfProcess);

}  // namespace qv::platform
