#pragma once

#include <functional>
#include <memory>
#include <string>
#include <unordered_set>
#include <utility>

#include "platform/sdbus/MemoryReturn.h"
#include "platform/sdbus/RefusalLog.h"
#include "platform/sdbus/SdBusIPC.h"
#include "platform/sdbus/UserQuotas.h"
#include "platform/threads/EventLoop.h"

namespace qv::platform::sdbus {

class BusDriver;
struct ListenerState;

/// What the connections and listeners of one service object share.
///
/// Threading: `drivers`, `listeners`, `refusals`, `memory` and what ends the service on the I/O thread; the rest is
/// immutable or thread-safe.
struct IPCContext {
  IPCContext(IPCPeerResolver peerResolver, SdBusIPCOptions serviceOptions)
      : resolver(std::move(peerResolver)), options(std::move(serviceOptions)), quotas(options.quotas) {}

  const IPCPeerResolver resolver;
  const SdBusIPCOptions options;
  UserQuotas quotas;
  /// Those that have a bus.
  std::unordered_set<std::shared_ptr<BusDriver>> drivers;
  std::unordered_set<std::shared_ptr<ListenerState>> listeners;
  /// Told once when `drivers` is empty; set while the service ends.
  std::function<void()> idleHandler;
  EventLoop::Timer closeTimer;
  RefusalLog refusals{io};
  MemoryReturn memory{io};
  void tellWhenIdle() {
    if (drivers.empty() && idleHandler) std::exchange(idleHandler, nullptr)();
  }
  EventLoop io;
};

}  // namespace qv::platform::sdbus
