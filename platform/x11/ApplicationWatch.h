#pragma once

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Value.h"
#include "platform/x11/Desktop.h"

namespace qv::platform {

/// The report on one application; see the keys in platform/Applications.h.
Dictionary applicationReport(const RunningApplication& application, uint32_t state);
/// The state bits of an application that shows windows.
uint32_t applicationStateOf(const RunningApplication& application);

/// Follows which applications run and which is in front, on a connection of its own.
///
/// The server tells of windows, of the active window and of the focus; the kernel of processes
/// that end. Several events of one switch are answered by one look, 50 ms after the first. Reports
/// on what lost the front come before the one on what gained it. When the server goes away nobody
/// is in front, and the watch tries once a second whether it is back.
///
/// Threading: `begin` and `run` on one thread.
class ApplicationWatch {
 public:
  ApplicationWatch(std::string display, BundleLookup bundleOfProcess, std::function<void(const Dictionary&)> handler,
                   int stopFd);
  /// Takes the present state, against which changes are reported.
  void begin();
  /// Reports changes until `stopFd` becomes readable.
  void run();

 private:
  using Clock = std::chrono::steady_clock;
  struct Known {
    RunningApplication application;
    FileDescriptor process;  // a pidfd: readable when the process has ended
    uint32_t state = 0;
  };
  void connect();
  void handleEvents();
  [[nodiscard]] bool concerns(const xcb_generic_event_t& event) const;
  void lookSoon();
  void look();
  void learn(std::vector<RunningApplication> present, std::vector<Dictionary>& losses, std::vector<Dictionary>& gains);
  bool report(const std::vector<Dictionary>& reports);
  [[nodiscard]] bool isStopped() const;
  /// False when stopped.
  bool sleep();

  const std::string display_;
  const BundleLookup bundleOfProcess_;
  const std::function<void(const Dictionary&)> handler_;
  const int stopFd_;
  std::unique_ptr<XcbConnection> connection_;
  xcb_atom_t activeWindowAtom_ = XCB_ATOM_NONE, managerAtom_ = XCB_ATOM_NONE, clientListAtom_ = XCB_ATOM_NONE;
  bool hasWindowManager_ = false;
  std::map<pid_t, Known> known_;
  std::optional<Clock::time_point> lookAt_;
};

}  // namespace qv::platform
