#pragma once

#include <sys/types.h>

#include <map>
#include <optional>
#include <vector>

#include "platform/x11/XcbConnection.h"

namespace qv::platform {

/// The process that owns a window, as the server knows it from the client's socket: not a claim
/// that the client makes. Nothing for 0, the root, a window that does not exist, a remote client,
/// and whatever the server answers ambiguously.
std::optional<pid_t> processOfWindow(XcbConnection& connection, xcb_window_t window);

/// The processes of windows that were listed a moment ago, in one round trip. Without the proof
/// of `processOfWindow` that each window still exists: not for admission.
std::map<xcb_window_t, pid_t> processesOfWindows(XcbConnection& connection, const std::vector<xcb_window_t>& windows);

}  // namespace qv::platform
