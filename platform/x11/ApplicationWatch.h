#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Value.h"
#include "platform/threads/CallbackGate.h"
#include "platform/threads/EventLoop.h"
#include "platform/x11/Desktop.h"
#include "platform/x11/DesktopWatch.h"

namespace qv::platform {

/// The report on one application; see the keys in platform/Applications.h.
Dictionary applicationReport(const RunningApplication& application, uint32_t state);
/// The state bits of an application that shows windows.
uint32_t applicationStateOf(const RunningApplication& application);

/// Follows which applications run and which is in front, on a thread and a connection of its own.
///
/// The server tells of windows, of the active window and of the focus; the kernel of processes
/// that end. Several events of one switch are answered by one look, 50 ms after the first. Reports
/// on what lost the front come before the one on what gained it. When the server goes away nobody
/// is in front, and the watch tries once a second whether it is back.
///
/// Threading: `begin` and `end` from any thread; the handler runs on the watch's.
class ApplicationWatch final : private DesktopWatchClient {
 public:
  ApplicationWatch(std::string display, BundleLookup bundleOfProcess, std::function<void(const Dictionary&)> handler);
  /// Takes the present state, against which changes are reported from now on, and waits for that.
  void begin();
  /// The last that is heard of `watch`. Waits for a report in progress and for its thread, except when called from
  /// within a report: then it goes right after.
  static void end(std::shared_ptr<ApplicationWatch> watch);

 private:
  struct Known {
    RunningApplication application;
    FileDescriptor process;  // a pidfd: readable when the process has ended
    EventLoop::Watch ended{};
    uint32_t state = 0;
  };
  void desktopConnected(XcbConnection& connection) override;
  bool desktopEventConcerns(const xcb_generic_event_t& event) override;
  void lookAtDesktop(XcbConnection& connection) override;
  void desktopWasLost() override;
  void processEnded();
  void reportChanges(const DesktopSnapshot& desktop);
  void learn(std::vector<RunningApplication> present, std::vector<Dictionary>& losses, std::vector<Dictionary>& gains);
  bool report(const std::vector<Dictionary>& reports);

  const BundleLookup bundleOfProcess_;
  const std::function<void(const Dictionary&)> handler_;
  CallbackGate gate_;
  // The loop's:
  xcb_atom_t activeWindowAtom_ = XCB_ATOM_NONE, managerAtom_ = XCB_ATOM_NONE, clientListAtom_ = XCB_ATOM_NONE;
  bool hasWindowManager_ = false;
  bool hasBegun_ = false;
  std::map<pid_t, Known> known_;
  DesktopWatch desktop_;
  EventLoop loop_;  // last: nothing runs on it any more when the rest goes
};

}  // namespace qv::platform
