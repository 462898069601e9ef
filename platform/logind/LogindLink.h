#pragma once

#include <systemd/sd-bus.h>

#include <chrono>
#include <memory>
#include <mutex>
#include <string>

#include "platform/SuspendMonitor.h"
#include "platform/base/FileDescriptor.h"
#include "platform/threads/EventLoop.h"

namespace qv::platform::logind {

/// The daemon's side of org.freedesktop.login1: two inhibitors and the announcement of sleep, on a bus
/// connection that exists between `open` and `close`.
///
/// An inhibitor is a descriptor; logind lets go when it is closed. "idle" is blocked, so that a
/// television that nobody touches does not sleep in mid-recording. "sleep" is delayed only: whoever
/// presses the button shall have it, by default 5 s later at most (InhibitDelayMaxSec of logind.conf).
///
/// Threading: `open`, `close`, `stop` and `setHandlers` from any thread; the rest on the loop.
class LogindLink {
 public:
  /// `busAddress`: empty for the system bus.
  explicit LogindLink(std::string busAddress) : busAddress_(std::move(busAddress)) {}

  void open();
  void close();
  /// Ends the thread; nothing happens after it. Not to be called by a handler.
  void stop() { loop_.stop(); }
  void setHandlers(SuspendHandlers handlers);

 private:
  struct Inhibitor {
    LogindLink* link;
    const char* what;
    const char* mode;
    FileDescriptor lock{};
    bool isWanted = false;
  };

  void connect();
  void disconnect();
  void process();
  void watchTimeout();
  void inhibit(Inhibitor& inhibitor);
  void release(Inhibitor& inhibitor);
  void prepareForSleep(bool starts);
  SuspendHandlers handlers();
  static int onInhibited(sd_bus_message* reply, void* inhibitor, sd_bus_error*);
  static int onPrepareForSleep(sd_bus_message* signal, void* link, sd_bus_error*);

  const std::string busAddress_;
  std::mutex mutex_;
  SuspendHandlers handlers_;  // guarded by mutex_
  // The loop's:
  struct BusCloser {
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
  };
  std::unique_ptr<sd_bus, BusCloser> bus_;
  EventLoop::Watch watch_;
  EventLoop::Timer timer_;
  Inhibitor idle_{this, "idle", "block"}, sleep_{this, "sleep", "delay"};
  /// The time that the device had slept since it was booted, when the present sleep was announced.
  std::chrono::nanoseconds sleptBefore_{0};
  EventLoop loop_;  // last: nothing runs on it any more when the rest goes
};

}  // namespace qv::platform::logind
