#pragma once

#include <systemd/sd-bus.h>

#include <memory>

namespace qv::platform::sdbus {

struct BusCloser {
  void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};
struct MessageReleaser {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};

/// Threading: I/O thread only, like everything of sd-bus.
using BusHandle = std::unique_ptr<sd_bus, BusCloser>;
using MessageHandle = std::unique_ptr<sd_bus_message, MessageReleaser>;

}  // namespace qv::platform::sdbus
