#pragma once

#include <sys/types.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Error.h"
#include "platform/base/Result.h"
#include "platform/base/Value.h"
#include "platform/threads/SerialQueue.h"

namespace qv::platform {

/// The domain of the errors that this layer itself gives to error handlers. The user information has
/// the text, and under kIPCRemoteErrorNameKey the D-Bus name of an error reply.
inline constexpr const char kIPCErrorDomain[] = "com.tarnwick.quorveld.IPC";
inline constexpr const char kIPCRemoteErrorNameKey[] = "remoteErrorName";
enum class IPCErrorCode : int64_t {
  ConnectionInvalid = 1,  ///< the peer is gone, or the connection was ended
  MessageDropped = 2,     ///< a media message, at the bound of a peer that does not keep up
  UnknownOperation = 3,   ///< the interface, or the peer, has no such operation
  InvalidArguments = 4,   ///< arguments that do not fit the operation or cannot be sent
  NoReply = 5,            ///< the peer let the call go unanswered
  RemoteError = 6,        ///< any other error reply, or a malformed reply
};

/// One operation of an interface, as it stands on the wire (docs/protocol.md).
///
/// `arguments` and `reply` are D-Bus signatures, one complete type per argument. `reply` is
/// nothing for a one-way operation; an operation with a completion handler has one, possibly
/// with no values.
struct IPCOperation {
  std::string member;                  ///< D-Bus member name
  std::vector<std::string> arguments;  ///< signatures
  std::vector<std::string> argumentNames;
  std::optional<std::vector<std::string>> reply;
  std::vector<std::string> replyNames;
  /// Media messages are dropped first when a peer does not keep up; control messages never are.
  bool isMedia = false;
};

/// A named set of operations: a D-Bus interface.
struct IPCInterface {
  std::string name;  ///< e.g. "com.tarnwick.quorveld.QVDaemonProtocol"
  std::vector<IPCOperation> operations;
  [[nodiscard]] const IPCOperation* operation(std::string_view member) const {
    const auto found = std::ranges::find(operations, member, &IPCOperation::member);
    return found == operations.end() ? nullptr : &*found;
  }
};

/// How Values stand in messages, by signature: b bool, i/u/x/t integers, d double, s string (also
/// for a URL, by its absolute string), ay Data, a{sv} Dictionary, any other array or struct an
/// Array, h a SharedFileDescriptor, v any of these. Inside a variant a Date is "(d)" and a URL is
/// "(s)". A none Value becomes the type's empty value.
using IPCArguments = std::vector<Value>;

/// The right to answer one call, at most once, from any thread. Copies share that right. When the
/// last copy goes unanswered the call fails with the D-Bus error
/// "com.tarnwick.quorveld.Error.NoReply", so that no caller waits for ever.
class IPCReply {
 public:
  class Sink {
   public:
    virtual ~Sink() = default;
    virtual void succeed(IPCArguments values) = 0;
    virtual void fail(std::string errorName, std::string message) = 0;
  };
  IPCReply() = default;
  explicit IPCReply(std::shared_ptr<Sink> sink) : sink_(std::move(sink)) {}
  void operator()(IPCArguments values) const {
    if (sink_) sink_->succeed(std::move(values));
  }
  void fail(std::string errorName, std::string message) const {
    if (sink_) sink_->fail(std::move(errorName), std::move(message));
  }

 private:
  std::shared_ptr<Sink> sink_;
};

class IPCConnection;

/// What a connection exports to its peer.
class IPCExportedObject {
 public:
  virtual ~IPCExportedObject() = default;
  /// Called on the connection's queue, one call at a time, with arguments of the operation's
  /// types. `reply` is inert for a call that expects none.
  virtual void handleCall(const std::shared_ptr<IPCConnection>& connection, const IPCOperation& operation,
                          IPCArguments arguments, IPCReply reply) = 0;
};

/// What a peer is now, compared with what it was when its connection was made.
enum class PeerStanding {
  Same,
  Uninstalled,     ///< it runs what it ran, but that is its bundle's no longer: updated, renamed or removed meanwhile
  AnotherProgram,  ///< the process has executed another program, or has ended
};

/// What a peer was when its connection was made: a process may become another program, and keeps its pid and its
/// connections.
///
/// Threading: thread-safe.
class PeerIdentity {
 public:
  virtual ~PeerIdentity() = default;
  /// Looks at the system anew each time: at some small files of it, and nothing slower.
  [[nodiscard]] virtual PeerStanding standing() const = 0;
};

/// Who is on the other side, found out once when the connection is made.
///
/// The process is pinned by `processHandle` (a pidfd), so that a reused pid is never mistaken for
/// it. `entitlements` come from root-owned files, never from the client.
struct IPCPeer {
  pid_t processIdentifier = 0;  ///< 0 when the peer is outside our pid namespace
  uid_t userIdentifier = 0;     ///< effective, of whoever connected
  SharedFileDescriptor processHandle;
  std::optional<std::string> bundleIdentifier;
  Dictionary entitlements;
  /// What `bundleIdentifier` and `entitlements` rest on; null where they are empty.
  std::shared_ptr<const PeerIdentity> identity;

  /// Of a peer without a bundle nothing is claimed, and nothing can have changed.
  [[nodiscard]] PeerStanding standing() const {
    if (!bundleIdentifier) return PeerStanding::Same;
    return identity ? identity->standing() : PeerStanding::AnotherProgram;
  }
};

/// Fills in `bundleIdentifier`, `entitlements` and `identity` of a peer whose process fields are set. Called once
/// for each connection, on the IPC thread: it reads small local files and nothing slower.
using IPCPeerResolver = std::function<void(IPCPeer&)>;

/// One end of a connection between two processes. Both ends may export interfaces and call.
///
/// Set handlers, interfaces and queue before `resume`; nothing is read before it. Handlers run
/// on the connection's queue. The loss of the peer is told once: by the invalidation handler; a
/// client's connection to a named service gets the interruption handler instead, and may be
/// connected anew by its owner. `invalidate` by this side calls the invalidation handler too,
/// unless it was cleared first. After either, calls go to their error handlers.
/// Every outstanding call ends exactly once: in its completion or in its error handler.
///
/// Threading: thread-safe.
class IPCConnection {
 public:
  using Completion = std::function<void(const IPCArguments&)>;
  using ErrorHandler = std::function<void(const Error&)>;

  virtual ~IPCConnection() = default;

  [[nodiscard]] virtual const IPCPeer& peer() const = 0;
  [[nodiscard]] pid_t processIdentifier() const { return peer().processIdentifier; }
  /// The value of an entitlement of the peer; none where it has none of that name.
  [[nodiscard]] Value valueForEntitlement(std::string_view name) const {
    return valueForKey(peer().entitlements, name);
  }

  /// For each interface that the peer may call, with the object that serves it. A second one of the same name takes the
  /// first one's place.
  virtual void setExportedInterface(const IPCInterface& interface, std::shared_ptr<IPCExportedObject> object) = 0;
  virtual void setRemoteInterface(const IPCInterface& interface) = 0;
  virtual void setInterruptionHandler(std::function<void()> handler) = 0;
  virtual void setInvalidationHandler(std::function<void()> handler) = 0;
  /// Handlers and calls run on a queue of the connection's own that targets `queue`, which must
  /// outlive the connection. Without it: on a queue of its own.
  virtual void setTargetQueue(SerialQueue& queue) = 0;
  virtual void resume() = 0;
  /// Idempotent. Control messages sent before it are still delivered where the peer reads on.
  virtual void invalidate() = 0;

  /// Calls `member` of the remote interface. `completion` may be empty for an operation without
  /// reply. `errorHandler` (may be empty) gets the failure: an unknown member, a peer that is
  /// gone, an error reply, a message that was dropped at the peer's bound.
  virtual void call(std::string_view member, IPCArguments arguments, Completion completion,
                    ErrorHandler errorHandler) = 0;
};

/// The right to connect to an anonymous listener: a descriptor that can be sent on.
class ListenerEndpoint {
 public:
  ListenerEndpoint() = default;
  explicit ListenerEndpoint(SharedFileDescriptor rendezvous) : rendezvous_(std::move(rendezvous)) {}
  [[nodiscard]] bool isValid() const { return rendezvous_ && rendezvous_->isValid(); }
  [[nodiscard]] const SharedFileDescriptor& rendezvous() const { return rendezvous_; }

 private:
  SharedFileDescriptor rendezvous_;
};

class IPCListener;

class IPCListenerDelegate {
 public:
  virtual ~IPCListenerDelegate() = default;
  /// Accept by configuring and resuming `connection`, keeping a reference, and answering true.
  /// Called on the listener's queue.
  virtual bool listenerShouldAcceptNewConnection(IPCListener& listener,
                                                 const std::shared_ptr<IPCConnection>& connection) = 0;
};

/// Accepts connections: to a named service, or to whoever holds its endpoint.
///
/// Threading: thread-safe. Destroying it ends it like `invalidate`.
class IPCListener {
 public:
  virtual ~IPCListener() = default;
  /// The delegate must outlive the listener or be cleared. Called on `queue`.
  virtual void setDelegate(IPCListenerDelegate* delegate, SerialQueue& queue) = 0;
  /// Opens the listener. A named one fails when the service already runs elsewhere.
  virtual std::optional<Error> resume() = 0;
  virtual void invalidate() = 0;
  /// Only of an anonymous listener.
  [[nodiscard]] virtual ListenerEndpoint endpoint() const = 0;
};

/// The inter-process messaging of this platform.
///
/// Threading: thread-safe.
class IPCService {
 public:
  virtual ~IPCService() = default;
  virtual std::unique_ptr<IPCListener> createListener(const std::string& serviceName) = 0;
  virtual std::unique_ptr<IPCListener> createAnonymousListener() = 0;
  /// Fails when nobody serves that name now.
  virtual Result<std::shared_ptr<IPCConnection>> connect(const std::string& serviceName) = 0;
  virtual Result<std::shared_ptr<IPCConnection>> connect(const ListenerEndpoint& endpoint) = 0;
};

}  // namespace qv::platform
