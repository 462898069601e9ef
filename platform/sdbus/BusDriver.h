#pragma once

#include <atomic>
#include <chrono>
#include <list>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <variant>
#include <vector>

#include "platform/sdbus/Backlog.h"
#include "platform/sdbus/GatedInput.h"
#include "platform/sdbus/Handles.h"
#include "platform/sdbus/InterfaceTable.h"
#include "platform/sdbus/Outbox.h"
#include "platform/threads/EventLoop.h"

namespace qv::platform::sdbus {

struct IPCContext;

inline constexpr const char kObjectPath[] = "/com/tarnwick/quorveld";
/// Sent, and read, at a turn of the loop; then others have theirs.
inline constexpr int kMessagesPerTurn = 64;

/// What a driver tells the link whose messages it moves, all on the I/O thread.
class BusDriverClient {
 public:
  virtual ~BusDriverClient() = default;
  /// `token` names the call in its answer; 0 where none is expected. `operation` is of `table`.
  virtual void driverReceivedCall(std::shared_ptr<const InterfaceTable> table, const IPCOperation& operation,
                                  IPCArguments arguments, uint64_t token) = 0;
  /// How a call ended: with its reply, or with an error.
  virtual void driverEndedCall(uint64_t id, std::variant<IPCArguments, Error> outcome) = 0;
  /// A call that has no reply is out.
  virtual void driverSentCall(uint64_t id) = 0;
  virtual void driverLostPeer() = 0;
  virtual void serviceEnds() = 0;
};

/// Moves the messages of one connection: from its outbox into a bus, and from the bus to its client.
///
/// Messages stand in the outbox until sd-bus has given its last one to the kernel, so that sd-bus's own queue never
/// holds more than one. While it has a bus the I/O thread keeps the driver alive; it reaches the client only weakly.
///
/// Threading: what is public from any thread, the settings before `resume`; everything else on the I/O thread.
class BusDriver final : public std::enable_shared_from_this<BusDriver> {
 public:
  enum class Side {
    Server,  ///< accepted; answers the bus object that stock libraries call first
    Client
  };
  BusDriver(std::shared_ptr<IPCContext> context, FileDescriptor socket, Side side);

  void setExportedInterface(const IPCInterface& interface);
  /// Held until the socket is closed.
  void setAdmission(std::shared_ptr<void> admission) { admission_ = std::move(admission); }
  /// The peer is not trusted: what it sends passes a gate. Without this, sd-bus reads the socket itself.
  void setGuard(PeerGuard guard) { guard_ = std::move(guard); }
  void resume(std::weak_ptr<BusDriverClient> client);

  [[nodiscard]] Outbox& outbox() { return outbox_; }
  [[nodiscard]] Backlog& backlog() { return backlog_; }
  /// Something stands in the outbox.
  void flushSoon();
  /// The backlog has room again.
  void readSoon();
  /// Sends what stands in the outbox, and closes when the peer has read it, or takes nothing any more.
  void drainAndClose();
  void closeSoon();
  /// The service goes; on the I/O thread.
  void endWithService();
  void close();

 private:
  /// An interface that is served here. sd-bus keeps pointers to it and to its methods.
  struct Exported {
    BusDriver* driver;
    std::shared_ptr<const InterfaceTable> table;
    std::vector<sd_bus_vtable> methods;
  };
  struct SentCall {
    uint64_t id;
    std::shared_ptr<const InterfaceTable> table;
    const IPCOperation* operation;
  };
  struct ReceivedCall {
    MessageHandle message;
    const IPCOperation* operation;
  };
  /// The end of a connection that was given up on our side.
  struct Drain {
    std::chrono::steady_clock::time_point lastProgress;  ///< of the peer
    EventLoop::Timer timer;
    uint64_t marker = 0;  ///< the cookie of the last message
  };
  enum class Peer { Unheard, Probed, Heard };
  /// Until when the peer has to end what it has begun.
  struct Deadline {
    uint64_t unit = 0;  ///< of the input's finished ones, that it is for
    EventLoop::Timer timer;
  };

  // BusDriver.cpp
  void post(void (BusDriver::*work)());
  void open();
  int prepareBus();
  void process(bool hangUp, bool writable);
  void processNext();
  bool pausesReading(bool hangUp);
  void updateWatch();
  void updateTimer();
  void drain();
  void awaitProgress(std::chrono::nanoseconds left);
  void checkProgress();
  void noteProgress();
  void lost(int error);

  // BusDriver_gate.cpp
  int connectBus(sd_bus* bus);
  Result<FileDescriptor> openInput();
  bool feed();
  void pauseReading();
  void watchSocket();
  void updateDeadline();
  void awaitEndOfMessage();
  void refuse(const std::string& why);

  // BusDriver_send.cpp
  void flush();
  bool mayFlush() const;
  bool mustHearPeerFirst();
  void send(OutgoingMessage message);
  int sendMessage(OutgoingCall& call);
  int sendMessage(OutgoingAnswer& answer);
  int sendMessage(OutgoingError& error);
  std::optional<ReceivedCall> takeReceived(uint64_t token);
  void sendingFailed(const OutgoingMessage& message, int error);
  int sendPing(uint64_t& cookie);
  void sendDrainMarker();

  // BusDriver_receive.cpp
  static int onMethod(sd_bus_message* message, void* exported, sd_bus_error* error);
  static int onMessage(sd_bus_message* message, void* driver, sd_bus_error* error);
  int receiveCall(const Exported& exported, sd_bus_message* message, sd_bus_error* error);
  void receiveReply(sd_bus_message* message);
  void endCall(uint64_t id, std::variant<IPCArguments, Error> outcome);

  const std::shared_ptr<IPCContext> context_;
  const Side side_;
  Outbox outbox_;
  Backlog backlog_;
  std::atomic<bool> isFlushScheduled_{false};

  // I/O thread:
  std::weak_ptr<BusDriverClient> client_;
  FileDescriptor socket_;  ///< sd-bus has copies, and closes them when it likes
  std::shared_ptr<void> admission_;
  std::optional<PeerGuard> guard_;  ///< until the bus is opened
  std::unique_ptr<GatedInput> input_;
  Deadline deadline_;
  EventLoop::Timer pause_;  ///< while the peer is not read because of its user's quota
  std::list<Exported> exported_;
  BusHandle bus_;
  EventLoop::Watch watch_;
  uint32_t watchedEvents_ = 0;
  EventLoop::Timer timer_;
  std::unordered_map<uint64_t, SentCall> sentCalls_;  ///< by cookie
  uint64_t lastToken_ = 0;
  std::unordered_map<uint64_t, ReceivedCall> received_;
  Peer peer_ = Peer::Unheard;
  bool everSent_ = false;
  std::optional<int> receiveFailure_;  ///< ends the connection after this step
  std::optional<Drain> drain_;
};

}  // namespace qv::platform::sdbus
