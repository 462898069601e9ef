#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/threads/EventLoop.h"
#include "platform/x11/DesktopWatch.h"
#include "platform/x11/ShownWindows.h"

namespace qv::platform {

/// Tells when the screen is divided otherwise among applications: a second one takes a part of it, or
/// gives it back.
///
/// A layout is reported when the number of its elements below level 2 has changed (see WindowLayout.h)
/// and was still the same `kSettling` later, against the layout that the first observer found. So an
/// alert, a menu or a tooltip that comes and goes is no change, nor is a second window of the same
/// application, nor one application in place of another; what is gone again at once is not seen. All of
/// these would end recordings whose picture has not changed.
///
/// While somebody observes, a thread sleeps on a connection of its own; the server wakes it when top-level
/// windows change. Where the server goes away the monitor tries once a second whether it is back, and
/// takes the layout that it finds then as given. Without observers there is neither connection nor
/// wake-up.
///
/// Threading: thread-safe; no call waits for the server, except the destructor. Observers are called on the
/// monitor's thread.
class X11DisplayLayoutMonitor final : public DisplayLayoutMonitor, private DesktopWatchClient {
 public:
  static constexpr std::chrono::milliseconds kSettling{400};
  X11DisplayLayoutMonitor(std::string display, BundleLookup bundleOfProcess);

  /// Adding one that observes already changes nothing.
  void addObserver(std::weak_ptr<DisplayLayoutObserver> observer) override;
  void removeObserver(const DisplayLayoutObserver* observer) override;
  /// Removes all observers, for good.
  void invalidate() override;

 private:
  void desktopConnected(XcbConnection& connection) override;
  bool desktopEventConcerns(const xcb_generic_event_t& event) override;
  void lookAtDesktop(XcbConnection& connection) override;
  void desktopWasLost() override;
  void report(const DisplayLayout& layout);
  void stopWatching();

  const BundleLookup bundleOfProcess_;
  std::mutex mutex_;
  // Guarded by mutex_:
  std::vector<std::pair<const DisplayLayoutObserver*, std::weak_ptr<DisplayLayoutObserver>>> observers_;
  bool isInvalid_ = false;
  // The loop's:
  xcb_atom_t clientListAtom_ = XCB_ATOM_NONE;
  int reported_ = 0;
  std::optional<int> settling_;
  DesktopWatch desktop_;
  EventLoop loop_;  // last: nothing runs on it any more when the rest goes
};

}  // namespace qv::platform
