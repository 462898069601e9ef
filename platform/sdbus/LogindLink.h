#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <string>

#include "platform/SuspendMonitor.h"
#include "platform/base/FileDescriptor.h"
#include "platform/sdbus/Handles.h"
#include "platform/sdbus/IOThread.h"

namespace qv::platform::sdbus {

/// The daemon's side of org.freedesktop.login1: two inhibitors and the announcement of sleep, on a bus
/// connection that exists between `open` and `close`.
///
/// An inhibitor is a descriptor; logind lets go when it is closed. "idle" is blocked, so that a
/// television that nobody touches does not sleep in mid-recording. "sleep" is delayed only: whoever
/// presses the button shall have it, by default 5 s later at most (InhibitDelayMaxSec of logind.conf).
///
/// Threading: `open`, `close`, `stop` and `setHandlers` from any thread; the rest on the I/O thread.
class LogindLink {
 public:
  /// `busAddress`: empty for the system bus.
  explicit LogindLink(std::string busAddress) : busAddress_(std::move(busAddress)) {}

  void open();
  void close();
  /// Ends the thread; nothing happens after it. Not to be called by a handler.
  void stop() { io_.stop(); }
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
  // I/O thread only:
  BusHandle bus_;
  IOThread::Token watch_ = 0, timer_ = 0;
  int fd_ = -1;
  Inhibitor idle_{this, "idle", "block"}, sleep_{this, "sleep", "delay"};
  /// The time that the device had slept since it was booted, when the present sleep was announced.
  std::chrono::nanoseconds sleptBefore_{0};
  IOThread io_;  // last: nothing runs on it any more when the rest goes
};

}  // namespace qv::platform::sdbus
