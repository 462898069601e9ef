#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/IPC.h"
#include "tests/kit/Events.h"

namespace qv::fakes {

/// The names of the error replies that the messaging itself makes.
inline constexpr const char kNoReplyErrorName[] = "com.tarnwick.quorveld.Error.NoReply";
inline constexpr const char kUnknownMethodErrorName[] = "org.freedesktop.DBus.Error.UnknownMethod";

/// One end of a connection within this process.
///
/// Behaves as platform/IPC.h says: arguments and replies are brought to the operation's types (a
/// value of another kind fails the call), calls end exactly once, nothing is read before `resume`,
/// a loss is told once. Handlers run on the connection's queue: that of `setTargetQueue`, or one on
/// the executor that the service was made with. Dropping the last reference ends the connection.
///
/// Threading: for a test in one thread.
class FakeIPCConnection final : public platform::IPCConnection, public std::enable_shared_from_this<FakeIPCConnection> {
 public:
  using Pair = std::pair<std::shared_ptr<FakeIPCConnection>, std::shared_ptr<FakeIPCConnection>>;

  /// `first` is the connector; `second` sees `peer`. With `named`, a loss is an interruption for `first`.
  static Pair makePair(platform::Executor& executor, platform::IPCPeer peer, bool named);
  FakeIPCConnection(platform::Executor& executor, platform::IPCPeer peer, bool named);
  ~FakeIPCConnection() override { end(false); }

  const platform::IPCPeer& peer() const override { return peer_; }
  void setExportedInterface(const platform::IPCInterface& interface,
                            std::shared_ptr<platform::IPCExportedObject> object) override {
    exported_[interface.name] = {interface, std::move(object)};
  }
  void setRemoteInterface(const platform::IPCInterface& interface) override { remoteInterface_ = interface; }
  void setInterruptionHandler(std::function<void()> handler) override { interruptionHandler_ = std::move(handler); }
  void setInvalidationHandler(std::function<void()> handler) override { invalidationHandler_ = std::move(handler); }
  void setTargetQueue(platform::SerialQueue& queue) override;
  void resume() override;
  void invalidate() override { end(false); }
  /// The other end has no room for further media messages.
  void fallBehind() {
    if (const auto other = other_.lock()) other->dropsMedia_ = true;
  }
  void call(std::string_view member, platform::IPCArguments arguments, Completion completion,
            ErrorHandler errorHandler) override;

 private:
  struct Pending {
    std::optional<std::vector<std::string>> reply;
    Completion completion;
    ErrorHandler errorHandler;
  };
  using Delivery = std::function<void(FakeIPCConnection&)>;

  void sendToOther(Delivery delivery);
  void deliver(Delivery delivery);
  void receiveCall(const std::string& interface, const std::string& member, platform::IPCArguments arguments,
                   uint64_t serial);
  void receiveAnswer(uint64_t serial, const platform::Result<platform::IPCArguments>& answer);
  void end(bool byPeer);

  const platform::IPCPeer peer_;
  const bool named_;
  std::unique_ptr<platform::SerialQueue> queue_;
  std::weak_ptr<FakeIPCConnection> other_;
  bool resumed_ = false, ended_ = false, dropsMedia_ = false;
  std::vector<std::function<void()>> inbox_;  ///< until it is resumed
  struct Exported {
    platform::IPCInterface interface;
    std::shared_ptr<platform::IPCExportedObject> object;
  };
  std::map<std::string, Exported> exported_;  ///< by interface
  platform::IPCInterface remoteInterface_;
  std::function<void()> interruptionHandler_, invalidationHandler_;
  uint64_t nextSerial_ = 1;
  std::map<uint64_t, Pending> pending_;
};

class FakeIPCListener;

/// Named and anonymous listeners, and connections to them, within this process.
///
/// Threading: for a test in one thread; without a listener it refuses from any. Must outlive its listeners.
class FakeIPCService final : public platform::IPCService {
 public:
  explicit FakeIPCService(platform::Executor& executor) : executor_(executor) {}

  std::unique_ptr<platform::IPCListener> createListener(const std::string& serviceName) override;
  std::unique_ptr<platform::IPCListener> createAnonymousListener() override;
  platform::Result<std::shared_ptr<platform::IPCConnection>> connect(const std::string& serviceName) override;
  platform::Result<std::shared_ptr<platform::IPCConnection>> connect(
      const platform::ListenerEndpoint& endpoint) override;

  /// What listeners see of the clients that connect from now on.
  void setClientPeer(platform::IPCPeer peer) { clientPeer_ = std::move(peer); }

 private:
  friend class FakeIPCListener;
  platform::Result<std::shared_ptr<platform::IPCConnection>> connectTo(const std::string& key, bool named);

  platform::Executor& executor_;
  std::map<std::string, FakeIPCListener*> listeners_;
  platform::IPCPeer clientPeer_;
};

/// An exported object that records its calls. `answer`, if set, is called for each of them, on the
/// connection's queue; otherwise the test answers through `ReceivedCall::reply`.
///
/// Threading: thread-safe; `answer` is set before the connection is resumed.
class RecordingExportedObject final : public platform::IPCExportedObject {
 public:
  struct ReceivedCall {
    std::string member;
    platform::IPCArguments arguments;
    platform::IPCReply reply;
  };

  void handleCall(const std::shared_ptr<platform::IPCConnection>& connection, const platform::IPCOperation& operation,
                  platform::IPCArguments arguments, platform::IPCReply reply) override;

  /// Removes and returns the oldest call; waits for it when calls come from another thread.
  ReceivedCall takeCall() { return calls_.next(); }
  [[nodiscard]] size_t callCount() const { return calls_.count(); }

  std::function<void(const ReceivedCall&)> answer;

 private:
  kit::Events<ReceivedCall> calls_;
};

}  // namespace qv::fakes
