#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <systemd/sd-bus.h>

#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "tests/kit/Events.h"
#include "tests/kit/Process.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform::test {

using kit::Events;

/// A message bus of the test's own.
class PrivateBus {
 public:
  PrivateBus()
      : program_("dbus-daemon", {"--nofork", "--nopidfile", "--nosyslog", "--print-address=1",
                                 "--config-file=" + folder_.write("/bus.conf", configuration())}) {
    EXPECT_NE(program_.readLine(), "") << "the bus did not come up";
  }
  [[nodiscard]] std::string address() const { return "unix:path=" + folder_.path("/bus"); }

 private:
  [[nodiscard]] std::string configuration() const {
    return "<busconfig><type>session</type><listen>" + address() + "</listen><policy context='default'>" +
           "<allow user='*'/><allow own='*'/><allow send_destination='*'/><allow eavesdrop='true'/>" +
           "</policy></busconfig>";
  }
  const kit::ScratchFolder folder_;
  kit::Process program_;
};

/// org.freedesktop.login1 as far as inhibitors go. Tells "idle block" when one is taken, and "idle released"
/// when it is let go of.
///
/// Threading: its own thread; `announceSleep` and `events` from any.
class FakeLogind {
 public:
  explicit FakeLogind(const std::string& address) {
    EXPECT_GE(sd_bus_new(&bus_), 0);
    EXPECT_GE(sd_bus_set_address(bus_, address.c_str()), 0);
    EXPECT_GE(sd_bus_set_bus_client(bus_, 1), 0);
    EXPECT_GE(sd_bus_start(bus_), 0);
    static const sd_bus_vtable methods[] = {SD_BUS_VTABLE_START(0),
                                            SD_BUS_METHOD("Inhibit", "ssss", "h", inhibit, SD_BUS_VTABLE_UNPRIVILEGED),
                                            SD_BUS_SIGNAL("PrepareForSleep", "b", 0), SD_BUS_VTABLE_END};
    EXPECT_GE(sd_bus_add_object_vtable(bus_, nullptr, kPath, kManager, methods, this), 0);
    EXPECT_GE(sd_bus_request_name(bus_, "org.freedesktop.login1", 0), 0);
    thread_ = std::thread([this] { run(); });
  }
  ~FakeLogind() {
    post(Command::Quit);
    thread_.join();
    sd_bus_close_unref(bus_);
  }
  void announceSleep(bool starts) { post(starts ? Command::Sleep : Command::Wake); }
  kit::Events<std::string> events;

 private:
  enum class Command { Quit, Sleep, Wake };
  static constexpr char kPath[] = "/org/freedesktop/login1", kManager[] = "org.freedesktop.login1.Manager";

  static int inhibit(sd_bus_message* call, void* self, sd_bus_error*) {
    const char *what = nullptr, *who = nullptr, *why = nullptr, *mode = nullptr;
    sd_bus_message_read(call, "ssss", &what, &who, &why, &mode);
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0) return -EMFILE;
    const FileDescriptor given(ends[1]);  // the reply takes a copy
    static_cast<FakeLogind*>(self)->inhibitors_.emplace_back(what, FileDescriptor(ends[0]));
    const int r = sd_bus_reply_method_return(call, "h", given.get());
    static_cast<FakeLogind*>(self)->events.add(std::string(what) + " " + mode);
    return r;
  }
  void post(Command command) {
    std::lock_guard lock(mutex_);
    commands_.push_back(command);
    ::eventfd_write(wake_.get(), 1);
  }
  bool obey() {
    std::lock_guard lock(mutex_);
    for (const Command command : std::exchange(commands_, {})) {
      if (command == Command::Quit) return false;
      sd_bus_emit_signal(bus_, kPath, kManager, "PrepareForSleep", "b", int{command == Command::Sleep});
    }
    return true;
  }
  void run() {
    while (obey()) {
      while (sd_bus_process(bus_, nullptr) > 0) {
      }
      std::vector<pollfd> watched{{wake_.get(), POLLIN, 0},
                                  {sd_bus_get_fd(bus_), static_cast<short>(sd_bus_get_events(bus_)), 0}};
      for (const auto& [what, end] : inhibitors_) watched.push_back({end.get(), POLLIN, 0});
      ::poll(watched.data(), watched.size(), -1);
      eventfd_t ignored = 0;
      if ((watched[0].revents & POLLIN) != 0) ::eventfd_read(wake_.get(), &ignored);
      for (size_t i = inhibitors_.size(); i-- > 0;) {
        if ((watched[i + 2].revents & POLLHUP) == 0) continue;
        events.add(inhibitors_[i].first + " released");
        inhibitors_.erase(inhibitors_.begin() + static_cast<ptrdiff_t>(i));
      }
    }
  }

  sd_bus* bus_ = nullptr;
  FileDescriptor wake_{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
  std::mutex mutex_;
  std::vector<Command> commands_;
  std::vector<std::pair<std::string, FileDescriptor>> inhibitors_;  // thread only
  std::thread thread_;
};

}  // namespace qv::platform::test
