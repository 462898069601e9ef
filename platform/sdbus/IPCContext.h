#pragma once

#include <functional>
#include <memory>
#include <string>
#include <unordered_set>
#include <utility>

#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/EventLoop.h"

namespace qv::platform::sdbus {

class BusDriver;
struct ListenerState;

/// What the connections and listeners of one service object share.
///
/// Threading: `drivers`, `listeners` and what ends the service on the I/O thread; the rest is immutable or thread-safe.
struct IPCContext {
  IPCContext(IPCPeerResolver peerResolver, SdBusIPCOptions serviceOptions)
      : resolver(std::move(peerResolver)), options(std::move(serviceOptions)) {}

  const IPCPeerResolver resolver;
  const SdBusIPCOptions options;
  /// Those that have a bus.
  std::unordered_set<std::shared_ptr<BusDriver>> drivers;
  std::unordered_set<std::shared_ptr<ListenerState>> listeners;
  /// Told once when `drivers` is empty; set while the service ends.
  std::function<void()> idleHandler;
  EventLoop::Timer closeTimer;
  void tellWhenIdle() {
    if (drivers.empty() && idleHandler) std::exchange(idleHandler, nullptr)();
  }
  EventLoop io;
};

}  // namespace qv::platform::sdbus
