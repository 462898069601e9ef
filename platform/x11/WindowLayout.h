#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/DisplayLayout.h"

namespace qv::platform {

/// Levels of what a display shows. Below 2 is what shares the screen among applications; from 2 on what
/// lies over them for a while.
namespace displaylevel {
/// A window that takes its part of the screen: full screen, maximized, or a tile, which spans the screen
/// (seven eighths of it) one way and more than an eighth of it the other way.
inline constexpr int64_t kApplication = 0;
/// The background, where nothing else is shown.
inline constexpr int64_t kDesktop = 1;
/// What floats: dialogs, alerts, small windows, a picture in the picture.
inline constexpr int64_t kFloating = 2;
/// Docks, panels, menus, tooltips, notifications; anything that the window manager does not manage, and
/// that does not fill the screen of a display without one.
inline constexpr int64_t kOverlay = 3;
}  // namespace displaylevel

/// A rectangle in pixels of the screen; empty where `right` <= `left` or `bottom` <= `top`.
struct ScreenArea {
  int left = 0, top = 0, right = 0, bottom = 0;
  [[nodiscard]] int64_t size() const {
    return right > left && bottom > top ? int64_t{right - left} * (bottom - top) : 0;
  }
};

/// A window that is mapped, as far as it lies on the screen.
struct ShownWindow {
  std::string owner;  ///< bundle identifier, or what else tells one application from another
  ScreenArea area;
  int64_t level = displaylevel::kFloating;
  bool isOpaque = true;
};

/// Whether an area has the extent of a tile, as told above.
bool isTile(const ScreenArea& area, const ScreenArea& screen);

/// What the user sees: one element for each application of which a twentieth of some window is not
/// covered, with the lowest level of those windows. Several windows of one application are one element;
/// a display that shows none has one element, the desktop.
DisplayLayout layoutOf(const std::vector<ShownWindow>& windows);

/// How many elements share the screen (level below 2).
int applicationCount(const DisplayLayout& layout);

}  // namespace qv::platform
