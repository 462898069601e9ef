#include "platform/x11/WindowLayout.h"

#include <algorithm>
#include <map>

namespace qv::platform {
namespace {

/// What is left of the areas without one.
std::vector<ScreenArea> without(const std::vector<ScreenArea>& areas, const ScreenArea& cover) {
  std::vector<ScreenArea> left;
  const auto keep = [&left](const ScreenArea& area) {
    if (area.size() > 0) left.push_back(area);
  };
  for (const ScreenArea& area : areas) {
    const ScreenArea common{std::max(area.left, cover.left), std::max(area.top, cover.top),
                            std::min(area.right, cover.right), std::min(area.bottom, cover.bottom)};
    if (common.size() == 0) {
      keep(area);
      continue;
    }
    keep({area.left, area.top, area.right, common.top});
    keep({area.left, common.bottom, area.right, area.bottom});
    keep({area.left, common.top, common.left, common.bottom});
    keep({common.right, common.top, area.right, common.bottom});
  }
  return left;
}

bool isSeen(const std::vector<ShownWindow>& windows, size_t at) {
  std::vector<ScreenArea> left{windows[at].area};
  for (size_t above = at + 1; above < windows.size() && !left.empty(); ++above)
    if (windows[above].isOpaque) left = without(left, windows[above].area);
  int64_t size = 0;
  for (const ScreenArea& area : left) size += area.size();
  return size * 20 >= windows[at].area.size();
}

}  // namespace

bool isTile(const ScreenArea& area, const ScreenArea& screen) {
  const int64_t width = area.right - area.left, height = area.bottom - area.top;
  const bool isWide = width * 8 >= int64_t{screen.right} * 7, isTall = height * 8 >= int64_t{screen.bottom} * 7;
  return (isWide && height * 8 > screen.bottom) || (isTall && width * 8 > screen.right);
}

DisplayLayout layoutOf(const std::vector<ShownWindow>& windows) {
  std::map<std::string, int64_t> levels;
  for (size_t i = 0; i < windows.size(); ++i) {
    if (!isSeen(windows, i)) continue;
    const auto [known, isNew] = levels.emplace(windows[i].owner, windows[i].level);
    if (!isNew) known->second = std::min(known->second, windows[i].level);
  }
  DisplayLayout layout;
  for (const auto& [owner, level] : levels) layout.elements.push_back({owner, level});
  if (layout.elements.empty()) layout.elements.push_back({"desktop", displaylevel::kDesktop});
  return layout;
}

int applicationCount(const DisplayLayout& layout) {
  return static_cast<int>(std::count_if(layout.elements.begin(), layout.elements.end(),
                                        [](const auto& element) { return element.level < displaylevel::kFloating; }));
}

}  // namespace qv::platform
