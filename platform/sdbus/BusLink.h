#pragma once

#include <atomic>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <variant>
#include <vector>

#include "platform/IPC.h"
#include "platform/sdbus/BusCoding.h"
#include "platform/sdbus/Handles.h"
#include "platform/sdbus/IOThread.h"
#include "platform/sdbus/InterfaceTable.h"

namespace qv::platform::sdbus {

struct IPCContext;

inline constexpr const char kObjectPath[] = "/com/tarnwick/quorveld";

/// What a link tells the connection that owns it. Called on the link's queue, while the owner lives.
class BusLinkOwner {
 public:
  virtual ~BusLinkOwner() = default;
  virtual void linkReceivedCall(const IPCOperation& operation, IPCArguments arguments, IPCReply reply) = 0;
  /// Told once. `mayReturn`: a named service that went away.
  virtual void linkEnded(bool mayReturn) = 0;
};

/// One D-Bus connection: its socket and bus, the bounded queue of what is to be sent, and the table
/// of the calls that have not ended.
///
/// A call stands in the table from `call` until it ends, by its answer or with the link; messages
/// stand in the outbox until sd-bus has given its last one to the kernel, so that sd-bus's own
/// queue (which counts no bytes) never holds more than one. The I/O thread keeps an open link
/// alive; it reaches the owner only weakly, and through the queue.
///
/// Threading: public operations are thread-safe. Members under `mutex_` are marked; the rest belong to
/// the I/O thread once `resume` was called.
class BusLink final : public std::enable_shared_from_this<BusLink> {
 public:
  enum class Role {
    Accepted,        ///< answers the bus object that stock libraries call first
    NamedConnector,  ///< its loss is an interruption: the service may come back
    EndpointConnector
  };

  BusLink(std::shared_ptr<IPCContext> context, FileDescriptor socket, Role role);
  ~BusLink();

  void setQueue(std::shared_ptr<SerialQueue> queue);
  void setExportedInterface(const IPCInterface& interface);
  void setRemoteInterface(const IPCInterface& interface);
  void setOwner(std::weak_ptr<BusLinkOwner> owner);
  void resume();

  void call(std::string_view member, IPCArguments arguments, IPCConnection::Completion completion,
            IPCConnection::ErrorHandler errorHandler);
  /// Answers a received call; ignored when the link has ended.
  void answer(uint64_t token, IPCArguments values);
  void answerError(uint64_t token, std::string name, std::string message);
  /// Ends the link: outstanding calls fail, nothing more is delivered, what was sent before still
  /// goes out. `tellOwner` false: it is being destroyed.
  void invalidate(bool tellOwner);
  /// Held until the link has closed its socket; set before `resume`.
  void setAdmission(std::shared_ptr<void> admission) { admission_ = std::move(admission); }

 private:
  enum class End { Invalidated, Destroyed, Lost, Overflow };
  struct PendingCall {
    const IPCOperation* operation;
    IPCConnection::Completion completion;
    IPCConnection::ErrorHandler errorHandler;
    bool isFrame;
    bool expectsReply;
  };
  struct Outgoing {
    enum class Kind { Call, Answer, ErrorAnswer } kind;
    uint64_t token;  ///< of the call, made or received
    const IPCOperation* operation = nullptr;
    IPCArguments values;
    bool expectsReply = false;
    std::string errorName;
    std::string errorMessage;
    size_t bytes = 0;
    bool hasDescriptors = false;
  };
  struct ReceivedCall {
    MessageHandle message;
    const IPCOperation* operation;
  };

  // BusLink_calls.cpp: any thread
  void failOnQueue(IPCConnection::ErrorHandler handler, Error error);
  [[nodiscard]] bool admitsMedia(const MessageCost& cost, bool expectsReply) const;
  void addCall(const IPCOperation& operation, IPCArguments arguments, const MessageCost& cost, PendingCall call);
  void pushAnswer(Outgoing message);
  bool push(Outgoing message);
  void endLocked(End end);
  void scheduleFlush();
  void postToSelf(void (BusLink::*work)());
  std::optional<PendingCall> takeCall(uint64_t id);

  // BusLink.cpp: I/O thread
  void open();
  int prepareBus();
  void onEvents(uint32_t events);
  void process(bool hangUp, bool writable);
  bool pauseReading(bool hangUp);
  void flush();
  void settleSent();
  std::optional<Outgoing> nextOutgoing();
  void send(Outgoing message);
  int sendCall(Outgoing& message);
  int sendAnswer(Outgoing& message);
  int sendPing(uint64_t& cookie);
  void sendDrainMarker();
  [[nodiscard]] bool mustHearPeerFirst();
  void updateWatch();
  void watchTimeout();
  void lost(int error);
  void drain();
  void close();

  // BusLink_receive.cpp: I/O thread
  static int onMethod(sd_bus_message* message, void* link, sd_bus_error* error);
  static int onMessage(sd_bus_message* message, void* link, sd_bus_error* error);
  int receiveCall(sd_bus_message* message, sd_bus_error* error);
  void receiveReply(sd_bus_message* message);
  void deliverCall(const IPCOperation& operation, IPCArguments arguments, uint64_t token);
  void endCall(uint64_t id, std::variant<IPCArguments, Error> outcome);
  void deliver(std::function<void()> work, size_t bytes);
  void handled(size_t bytes);
  [[nodiscard]] bool hasTooMuchUnhandled() const;

  const std::shared_ptr<IPCContext> context_;
  const Role role_;

  mutable std::mutex mutex_;
  // Under mutex_:
  bool ended_ = false;
  std::shared_ptr<SerialQueue> queue_;
  std::weak_ptr<BusLinkOwner> owner_;
  std::vector<std::shared_ptr<const InterfaceTable>> remotes_;  ///< the last is in force; messages name the others
  std::deque<Outgoing> outbox_;
  size_t queuedBytes_ = 0;
  size_t queuedMediaBytes_ = 0;
  bool flushScheduled_ = false;
  uint64_t lastCall_ = 0;
  std::unordered_map<uint64_t, PendingCall> calls_;
  size_t framesInFlight_ = 0;
  size_t mediaCallsInFlight_ = 0;
  uint64_t droppedMedia_ = 0;

  std::atomic<size_t> unhandledMessages_{0};
  std::atomic<size_t> unhandledBytes_{0};
  std::atomic<bool> readingPaused_{false};

  // I/O thread:
  FileDescriptor socket_;  ///< until the bus has it
  std::shared_ptr<const InterfaceTable> exported_;
  std::vector<sd_bus_vtable> exportedMethods_;
  BusHandle bus_;
  int fd_ = -1;  ///< the bus's
  IOThread::Token watch_ = 0;
  uint32_t watchedEvents_ = 0;
  IOThread::Token timer_ = 0;
  IOThread::Token drainTimer_ = 0;
  struct SentCall {
    uint64_t id;
    const IPCOperation* operation;
  };
  std::unordered_map<uint64_t, SentCall> callsByCookie_;
  uint64_t lastToken_ = 0;
  std::unordered_map<uint64_t, ReceivedCall> received_;
  size_t sentBytes_ = 0;       ///< of what sd-bus may still hold
  size_t sentMediaBytes_ = 0;  ///< of it, media
  bool everSent_ = false;
  bool heardPeer_ = false;  ///< a message came, so the peer has finished authenticating
  uint64_t probeCookie_ = 0;
  bool draining_ = false;
  uint64_t drainCookie_ = 0;
  int receiveFailure_ = 0;
  std::shared_ptr<void> admission_;
};

}  // namespace qv::platform::sdbus
