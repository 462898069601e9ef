#pragma once

#include <sys/socket.h>

#include "fuzz/Target.h"
#include "platform/base/FileDescriptor.h"
#include "platform/sdbus/Handles.h"

namespace qv::fuzz {

/// A server's end of a connection, of sd-bus alone, and the socket of its peer.
struct ServerBus {
  ServerBus(sd_bus_message_handler_t receive, void* context) {
    int ends[2];
    require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0, "sockets");
    peer.reset(ends[0]);
    sd_bus* made = nullptr;
    require(sd_bus_new(&made) >= 0, "memory");
    bus.reset(made);
    const bool isMade = sd_bus_set_fd(made, ends[1], ends[1]) >= 0 && sd_bus_negotiate_fds(made, 1) >= 0 &&
                        sd_bus_set_server(made, 1, {}) >= 0 &&
                        sd_bus_add_filter(made, nullptr, receive, context) >= 0 && sd_bus_start(made) >= 0;
    require(isMade, "a bus");
  }
  /// As sd_bus_process says it at last: 0 where the connection goes on.
  int processAll() const {
    int r = 1;
    while (r > 0) r = sd_bus_process(bus.get(), nullptr);
    return r;
  }
  [[nodiscard]] bool isReady() const { return sd_bus_is_ready(bus.get()) > 0; }

  platform::FileDescriptor peer;
  platform::sdbus::BusHandle bus;
};

}  // namespace qv::fuzz
