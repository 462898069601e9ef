#pragma once

#include "platform/x11/XcbConnection.h"

namespace qv::platform {

/// The root's property that names the window of the indicator (IndicatorWindow), for those who capture.
inline constexpr const char kIndicatorProperty[] = "_QUORVEL_INDICATOR";

/// Takes the indicator's picture out of a window's pixels. A server that gives a window memory of its own, because it
/// is captured, mapped or resized, fills that with what is on the screen there, the indicator too; of a window without
/// a background nothing replaces it until the application paints. Where the indicator lies over the window or one
/// within it, that part becomes the background, or black, and the application is told to paint it. Nobody sees that on
/// the screen.
void wipeIndicatorFrom(XcbConnection& connection, xcb_window_t window);

}  // namespace qv::platform
