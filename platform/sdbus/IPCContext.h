#pragma once

#include <functional>
#include <memory>
#include <string>
#include <unordered_set>
#include <utility>

#include "platform/sdbus/IOThread.h"
#include "platform/sdbus/SdBusIPC.h"

namespace qv::platform::sdbus {

class BusLink;
struct ListenerState;

/// What the connections and listeners of one service object share.
///
/// Threading: `links`, `listeners` and `idleHandler` on the I/O thread; the rest is immutable or thread-safe.
struct IPCContext {
  IPCContext(IPCPeerResolver peerResolver, SdBusIPCOptions serviceOptions)
      : resolver(std::move(peerResolver)), options(std::move(serviceOptions)) {}

  const IPCPeerResolver resolver;
  const SdBusIPCOptions options;
  /// Those that have a bus.
  std::unordered_set<std::shared_ptr<BusLink>> links;
  std::unordered_set<std::shared_ptr<ListenerState>> listeners;
  /// Told once when `links` is empty; set while the service ends.
  std::function<void()> idleHandler;
  void tellWhenIdle() {
    if (links.empty() && idleHandler) std::exchange(idleHandler, nullptr)();
  }
  IOThread io;
};

}  // namespace qv::platform::sdbus
