#include "daemon/DisplayLayoutRule.h"

#include <algorithm>

namespace qv {

namespace {
constexpr int64_t kOverApplicationsLevel = 2;
}

DisplayLayoutRule::~DisplayLayoutRule() {
  if (layoutMonitor_) layoutMonitor_->invalidate();
}

void DisplayLayoutRule::observe() {
  if (!layoutMonitor_) return;
  wasShared_ = false;
  layoutMonitor_->addObserver(weak_from_this());
}

void DisplayLayoutRule::ignore() {
  if (layoutMonitor_) layoutMonitor_->removeObserver(this);
}

void DisplayLayoutRule::layoutMonitorDidUpdateDisplayLayout(platform::DisplayLayoutMonitor&,
                                                            const platform::DisplayLayout& layout) {
  sequence_.async(weak_from_this(), [layout](DisplayLayoutRule& rule) { rule.applyDisplayLayout(layout); });
}

void DisplayLayoutRule::applyDisplayLayout(const platform::DisplayLayout& layout) {
  const auto& elements = layout.elements;
  const auto ordinary = std::ranges::count_if(
      elements, [](const platform::DisplayLayoutElement& element) { return element.level < kOverApplicationsLevel; });
  const bool isAlone = elements.size() == 1;
  const bool mustStop = isAlone ? wasShared_ : ordinary == static_cast<int64_t>(elements.size());
  wasShared_ = !isAlone && ordinary > 1;
  if (mustStop) stop_();
}

}  // namespace qv
