#include "platform/x11/X11DisplayLayoutMonitor.h"

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"

namespace qv::platform {

X11DisplayLayoutMonitor::X11DisplayLayoutMonitor(std::string display, BundleLookup bundleOfProcess)
    : bundleOfProcess_(std::move(bundleOfProcess)), desktop_(loop_, *this, std::move(display), kSettling) {}

void X11DisplayLayoutMonitor::addObserver(std::weak_ptr<DisplayLayoutObserver> observer) {
  const auto strong = observer.lock();
  std::lock_guard lock(mutex_);
  if (!strong || isInvalid_) return;
  const auto known = [&](const auto& entry) { return entry.first == strong.get(); };
  if (std::ranges::any_of(observers_, known)) return;
  observers_.emplace_back(strong.get(), std::move(observer));
  // A new time of observation has its own layout to begin with.
  if (observers_.size() == 1) loop_.post([this] { desktop_.begin(); });
}

void X11DisplayLayoutMonitor::removeObserver(const DisplayLayoutObserver* observer) {
  std::lock_guard lock(mutex_);
  const auto removed = std::erase_if(observers_, [observer](const auto& entry) { return entry.first == observer; });
  if (removed > 0 && observers_.empty()) stopWatching();
}

void X11DisplayLayoutMonitor::invalidate() {
  std::lock_guard lock(mutex_);
  isInvalid_ = true;
  if (!std::exchange(observers_, {}).empty()) stopWatching();
}

void X11DisplayLayoutMonitor::stopWatching() {
  loop_.post([this] { desktop_.end(); });
}

void X11DisplayLayoutMonitor::desktopConnected(XcbConnection& connection) {
  settling_.reset();
  const uint32_t mask = XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY | XCB_EVENT_MASK_PROPERTY_CHANGE;
  xcb_change_window_attributes(connection.get(), connection.root(), XCB_CW_EVENT_MASK, &mask);
  clientListAtom_ = connection.atom("_NET_CLIENT_LIST_STACKING");
  reported_ = applicationCount(layoutOf(readShownWindows(connection, bundleOfProcess_)));
  if (connection.isLost()) return;
  QV_LOG_INFO(logs::kPlatform, "display layout: observed, the screen is divided among %d", reported_);
}

bool X11DisplayLayoutMonitor::desktopEventConcerns(const xcb_generic_event_t& event) {
  const int type = event.response_type & 0x7F;
  if (type == XCB_PROPERTY_NOTIFY) {
    return reinterpret_cast<const xcb_property_notify_event_t&>(event).atom == clientListAtom_;
  }
  return type != XCB_CREATE_NOTIFY && type != 0;  // what was only created is not seen
}

void X11DisplayLayoutMonitor::desktopWasLost() {
  QV_LOG_INFO(logs::kPlatform, "display layout: the X server has gone");
}

void X11DisplayLayoutMonitor::lookAtDesktop(XcbConnection& connection) {
  const auto layout = layoutOf(readShownWindows(connection, bundleOfProcess_));
  if (connection.isLost()) return;
  const int count = applicationCount(layout);
  if (count == reported_) {
    settling_.reset();
  } else if (settling_ != count) {
    settling_ = count;
    desktop_.lookIn(kSettling);
  } else {
    settling_.reset();
    reported_ = count;
    QV_LOG_INFO(logs::kPlatform, "display layout: the screen is divided among %d", count);
    report(layout);
  }
}

void X11DisplayLayoutMonitor::report(const DisplayLayout& layout) {
  decltype(observers_) observers;
  {
    std::lock_guard lock(mutex_);
    observers = observers_;
  }
  for (const auto& [address, weak] : observers)
    if (const auto observer = weak.lock()) observer->layoutMonitorDidUpdateDisplayLayout(*this, layout);
}

}  // namespace qv::platform
