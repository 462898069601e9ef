#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace qv::platform {

/// One element of what the display shows.
struct DisplayLayoutElement {
  std::string identifier;
  int64_t level = 0;  ///< 0: an ordinary application; 2 and above: over applications
};
struct DisplayLayout {
  std::vector<DisplayLayoutElement> elements;
};

class DisplayLayoutMonitor;
class DisplayLayoutObserver {
 public:
  virtual ~DisplayLayoutObserver() = default;
  /// Called on the monitor's own thread.
  virtual void layoutMonitorDidUpdateDisplayLayout(DisplayLayoutMonitor& monitor, const DisplayLayout& layout) = 0;
};

/// Threading: thread-safe.
class DisplayLayoutMonitor {
 public:
  virtual ~DisplayLayoutMonitor() = default;
  virtual void addObserver(std::weak_ptr<DisplayLayoutObserver> observer) = 0;
  virtual void removeObserver(const DisplayLayoutObserver* observer) = 0;
  virtual void invalidate() = 0;
};

}  // namespace qv::platform
