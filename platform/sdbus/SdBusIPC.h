#pragma once

#include <memory>
#include <string>

#include "platform/IPC.h"

namespace qv::platform {

namespace sdbus {
struct IPCContext;
}

/// What all peers of one user may take together.
struct IPCQuotas {
  size_t connections = 256;                  ///< of listeners; root's are not counted
  double connectionsPerSecond = 20;          ///< for long; `connections` at once. More are refused; not of root
  size_t unfinishedBytes = size_t{8} << 20;  ///< of messages that have begun; who goes beyond is dropped
  double callsPerSecond = 1000;              ///< for long, of messages of any kind; beyond, peers are read later
  double callsAtOnce = 2000;
};

/// Where and within which bounds a service object works. The bounds are per peer, but for the quotas.
struct SdBusIPCOptions {
  /// Peers are believed to send sound messages, as a daemon is. Otherwise everything that comes passes a gate before
  /// sd-bus reads it, the quotas count, and over a named service only the process that connected is listened to.
  bool trustsPeers = false;
  IPCQuotas quotas;
  /// How long a peer that is not trusted may take for a message that it has begun, and for the authentication.
  int unfinishedMilliseconds = 10000;
  /// Where the sockets of named services stand. Empty: $XDG_RUNTIME_DIR, or /run without it; then
  /// `connect` looks in /run too.
  std::string runtimeDirectory;
  /// The group whose members may connect to named services, besides root and the user of this process: a name, or a
  /// number. Empty: the group of this process. A socket of the service manager's keeps what that gave it.
  std::string socketGroup;
  /// Bytes of queued messages beyond which media messages are dropped.
  size_t maximumQueuedMediaBytes = size_t{4} << 20;
  /// Bytes of queued messages of any kind beyond which the peer is cut off.
  size_t maximumQueuedBytes = size_t{64} << 20;
  /// Media messages with descriptors (frames) that the peer has not answered. At 60 a second the
  /// peer may be a quarter of a second behind; each holds a frame's memory.
  size_t maximumFramesInFlight = 16;
  /// Other media messages that the peer has not answered, of those that have an answer.
  size_t maximumMediaCallsInFlight = 512;
  /// Received messages that wait for their handlers; with more, the peer is not read.
  size_t maximumUnhandledMessages = 256;
  size_t maximumUnhandledBytes = size_t{8} << 20;
  /// Calls that a peer may have waiting for their answers; more are refused.
  size_t maximumUnansweredCalls = 1024;
  /// Connections that one listener holds at a time.
  size_t maximumConnections = 8192;
  /// An invalidated connection stays open while the peer takes what was sent before, and is closed when the peer has
  /// taken nothing for so long. With the service it ends after that time in any case.
  int drainMilliseconds = 1000;
};

/// Of a process whose peers are the daemon's.
inline SdBusIPCOptions optionsForTrustedPeers() {
  SdBusIPCOptions options;
  options.trustsPeers = true;
  return options;
}

/// Inter-process messaging in the D-Bus wire format, peer to peer over Unix sockets, without a
/// broker (docs/protocol.md).
///
/// One thread, started with the first connection or listener, makes every call of sd-bus: a bus
/// object must not be used from two threads. It sleeps while no peer says anything. Handlers run
/// on the connections' queues, never on that thread.
///
/// Destroying the service ends its listeners and connections, and waits at most
/// `drainMilliseconds` for peers to take what was sent.
///
/// Threading: thread-safe; destroy it from a thread of none of its handlers.
class SdBusIPCService final : public IPCService {
 public:
  /// `resolver` may be empty. It is called for accepted connections.
  explicit SdBusIPCService(IPCPeerResolver resolver = {}, SdBusIPCOptions options = {});
  ~SdBusIPCService() override;

  std::unique_ptr<IPCListener> createListener(const std::string& serviceName) override;
  std::unique_ptr<IPCListener> createAnonymousListener() override;
  /// The peer of a named service's connection is the process that opened the socket: the daemon, or
  /// the service manager that started it.
  Result<std::shared_ptr<IPCConnection>> connect(const std::string& serviceName) override;
  Result<std::shared_ptr<IPCConnection>> connect(const ListenerEndpoint& endpoint) override;

 private:
  std::shared_ptr<sdbus::IPCContext> context_;
};

}  // namespace qv::platform
