#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "platform/DisplayLayout.h"
#include "platform/threads/SerialQueue.h"

namespace qv {

/// Ends the recordings of applications when they begin to share the screen, or stop sharing it. The layout in which a
/// recording begins is the one that it belongs to.
///
/// Threading: sequence only, but for the monitor's calls. It must be held by a shared pointer.
class DisplayLayoutRule final : public platform::DisplayLayoutObserver,
                                public std::enable_shared_from_this<DisplayLayoutRule> {
 public:
  /// `stop` runs on the sequence, which must outlive the rule.
  DisplayLayoutRule(platform::SerialQueue& sequence, std::function<void()> stop)
      : sequence_(sequence), stop_(std::move(stop)) {}
  ~DisplayLayoutRule() override;

  void setLayoutMonitor(std::shared_ptr<platform::DisplayLayoutMonitor> monitor) {
    layoutMonitor_ = std::move(monitor);
  }
  /// From now on; what was counted before says nothing.
  void observe();
  void ignore();

  void layoutMonitorDidUpdateDisplayLayout(platform::DisplayLayoutMonitor& monitor,
                                           const platform::DisplayLayout& layout) override;

 private:
  void applyDisplayLayout(const platform::DisplayLayout& layout);

  platform::SerialQueue& sequence_;
  const std::function<void()> stop_;
  std::shared_ptr<platform::DisplayLayoutMonitor> layoutMonitor_;
  int64_t previousElementCount_ = 0;
};

}  // namespace qv
