#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "platform/StatusBar.h"
#include "platform/threads/EventLoop.h"
#include "platform/x11/DesktopWatch.h"
#include "platform/x11/IndicatorModule.h"

namespace qv::platform {

/// A window in the upper right corner of the screen that nobody manages, above all others: whatever comes to lie over
/// it, it is raised again 50 ms later, and it is made anew where another client has taken it away. It never has the
/// keyboard. Its picture is the window's background, so the server repaints it by itself.
///
/// It is no part of what is captured of an application's windows (a property of the root tells those who capture which
/// window it is, see IndicatorTraces.h), but of the screen it is.
///
/// Threading: as StatusBarOverrideAssertion. All that it does is done on its loop; its end waits for that.
class IndicatorWindow final : public StatusBarOverrideAssertion, private DesktopWatchClient {
 public:
  IndicatorWindow(std::string display, std::filesystem::path module, StatusBarOverride shown,
                  std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate);
  void update(const StatusBarOverride& shown) override;

 private:
  void begin();
  void desktopConnected(XcbConnection& connection) override;
  bool desktopEventConcerns(const xcb_generic_event_t& event) override;
  void lookAtDesktop(XcbConnection& connection) override;
  void desktopWasLost() override;
  void refuseUnsupportedPixels(XcbConnection& connection);
  void ensureWindow(XcbConnection& connection);
  void paint(XcbConnection& connection, uint8_t depth);

  const std::filesystem::path module_;
  const std::weak_ptr<StatusBarOverrideCoordinatorDelegate> delegate_;
  // The loop's:
  StatusBarOverride shown_;
  std::unique_ptr<IndicatorPainter> painter_;  // none where nothing can be shown
  IndicatorImage image_;
  xcb_window_t window_ = XCB_NONE;
  uint16_t screenWidth_ = 0, screenHeight_ = 0;
  bool isStale_ = true;  // the picture
  DesktopWatch desktop_;
  EventLoop loop_;  // last: nothing runs on it any more when the rest goes
};

}  // namespace qv::platform
