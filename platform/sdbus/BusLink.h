#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <variant>

#include "platform/IPC.h"
#include "platform/sdbus/BusDriver.h"

namespace qv::platform::sdbus {

/// What a link tells the connection that owns it. Called on the link's queue, while the owner lives.
class BusLinkOwner {
 public:
  virtual ~BusLinkOwner() = default;
  /// `interface` is the name of the exported interface that the operation belongs to.
  virtual void linkReceivedCall(const std::string& interface, const IPCOperation& operation, IPCArguments arguments,
                                IPCReply reply) = 0;
  /// Told once. `mayReturn`: a named service that went away.
  virtual void linkEnded(bool mayReturn) = 0;
};

/// The calls over one D-Bus connection. A call stands in a table from `call` until it ends, by its answer or with the
/// link. What the peer causes is queued for the owner; the driver moves the messages.
///
/// Threading: thread-safe; the functions of BusDriverClient on the I/O thread.
class BusLink final : public BusDriverClient, public std::enable_shared_from_this<BusLink> {
 public:
  enum class Role {
    Accepted,
    NamedConnector,  ///< its loss is an interruption: the service may come back
    EndpointConnector
  };

  BusLink(std::shared_ptr<IPCContext> context, FileDescriptor socket, Role role);

  void setQueue(std::shared_ptr<SerialQueue> queue);
  void setExportedInterface(const IPCInterface& interface) { driver_->setExportedInterface(interface); }
  void setRemoteInterface(const IPCInterface& interface);
  void setOwner(std::weak_ptr<BusLinkOwner> owner);
  /// Held until the link has closed its socket; set before `resume`.
  void setAdmission(std::shared_ptr<void> admission) { driver_->setAdmission(std::move(admission)); }
  /// For a peer that is not trusted; set before `resume`.
  void setGuard(PeerGuard guard) { driver_->setGuard(std::move(guard)); }
  void resume() { driver_->resume(weak_from_this()); }

  void call(std::string_view member, IPCArguments arguments, IPCConnection::Completion completion,
            IPCConnection::ErrorHandler errorHandler);
  /// Answers a received call; ignored when the link has ended.
  void answer(OutgoingAnswer answer);
  void answer(OutgoingError error);
  /// Ends the link: outstanding calls fail, nothing more is delivered, what was sent before still
  /// goes out. `tellOwner` false: it is being destroyed.
  void invalidate(bool tellOwner);

  void driverReceivedCall(std::shared_ptr<const InterfaceTable> table, const IPCOperation& operation,
                          IPCArguments arguments, uint64_t token) override;
  void driverEndedCall(uint64_t id, std::variant<IPCArguments, Error> outcome) override;
  void driverSentCall(uint64_t id) override;
  void driverLostPeer() override;
  void serviceEnds() override { invalidate(true); }

 private:
  enum class End { Invalidated, Destroyed, Lost, Overflow };
  struct PendingCall {
    IPCConnection::Completion completion;
    IPCConnection::ErrorHandler errorHandler;
    Outbox::Slot slot;
  };

  // All with the lock held:
  void addCall(const IPCOperation& operation, IPCArguments arguments, const MessageCost& cost, PendingCall call);
  /// Also lets go of the call there: it may hold the last of its own connection, whose end takes the lock.
  void failOnQueue(PendingCall call, IPCErrorCode code, const std::string& text);
  void push(OutgoingMessage message, const MessageCost& cost);
  void endLocked(End end);
  void deliver(std::function<void()> work, size_t bytes);

  const Role role_;
  const std::shared_ptr<BusDriver> driver_;
  std::mutex mutex_;
  // Guarded by mutex_:
  bool ended_ = false;
  std::shared_ptr<SerialQueue> queue_;
  std::weak_ptr<BusLinkOwner> owner_;
  std::shared_ptr<const InterfaceTable> remote_;
  uint64_t lastCall_ = 0;
  std::map<uint64_t, PendingCall> calls_;  ///< in the order in which they were made
  bool hasDroppedMedia_ = false;
};

}  // namespace qv::platform::sdbus
