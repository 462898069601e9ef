#include "daemon/DisplayLayoutRule.h"

#include <algorithm>

namespace qv {

namespace {
constexpr int64_t kOverApplicationsLevel = 2;
}

DisplayLayoutRule::~DisplayLayoutRule() {
  if (!layoutMonitor_) return;
  layoutMonitor_->removeObserver(this);
  layoutMonitor_->invalidate();
}

void DisplayLayoutRule::observe() {
  if (!layoutMonitor_) return;
  previousElementCount_ = 0;
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
  const auto isOrdinary = [](const platform::DisplayLayoutElement& element) {
    return element.level < kOverApplicationsLevel;
  };
  int64_t count = 0;
  bool mustStop = false;
  if (elements.size() == 1) {
    mustStop = previousElementCount_ > 1;
  } else {
    count = std::count_if(elements.begin(), elements.end(), isOrdinary);
    mustStop = count == static_cast<int64_t>(elements.size());
  }
  previousElementCount_ = count;
  if (mustStop) stop_();
}

}  // namespace qv
