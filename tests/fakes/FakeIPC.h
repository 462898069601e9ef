#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/IPC.h"

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
/// Threading: thread-safe.
class FakeIPCConnection final : public platform::IPCConnection, public std::enable_shared_from_this<FakeIPCConnection> {
 public:
  struct End;
  using Pair = std::pair<std::shared_ptr<FakeIPCConnection>, std::shared_ptr<FakeIPCConnection>>;

  /// `first` is the connector: it sees `firstsPeer`. With `named`, its loss is an interruption.
  static Pair makePair(platform::Executor& executor, platform::IPCPeer firstsPeer, platform::IPCPeer secondsPeer,
                       bool named);
  explicit FakeIPCConnection(std::shared_ptr<End> end);
  ~FakeIPCConnection() override;

  const platform::IPCPeer& peer() const override;
  void setExportedInterface(const platform::IPCInterface& interface,
                            std::shared_ptr<platform::IPCExportedObject> object) override;
  void setRemoteInterface(const platform::IPCInterface& interface) override;
  void setInterruptionHandler(std::function<void()> handler) override;
  void setInvalidationHandler(std::function<void()> handler) override;
  void setTargetQueue(platform::SerialQueue& queue) override;
  void resume() override;
  void invalidate() override;
  void call(std::string_view member, platform::IPCArguments arguments, Completion completion,
            ErrorHandler errorHandler) override;

  /// While off, what this end sends and what replies bring it is let through as it is: a test can
  /// so be a peer that no honest one would be.
  void setChecksMessages(bool checks);
  [[nodiscard]] bool isEnded() const;

 private:
  std::shared_ptr<End> end_;
};

class FakeIPCListener;

/// Named and anonymous listeners, and connections to them, within this process.
///
/// Threading: thread-safe. Must outlive its listeners.
class FakeIPCService final : public platform::IPCService {
 public:
  explicit FakeIPCService(platform::Executor& executor);
  ~FakeIPCService() override;

  std::unique_ptr<platform::IPCListener> createListener(const std::string& serviceName) override;
  std::unique_ptr<platform::IPCListener> createAnonymousListener() override;
  platform::Result<std::shared_ptr<platform::IPCConnection>> connect(const std::string& serviceName) override;
  platform::Result<std::shared_ptr<platform::IPCConnection>> connect(
      const platform::ListenerEndpoint& endpoint) override;

  /// What listeners see of the clients that connect from now on.
  void setClientPeer(platform::IPCPeer peer);
  /// See FakeIPCConnection::setChecksMessages; for both ends of the connections made from now on.
  void setChecksMessages(bool checks);
  /// How often `connect` was called, with success or without.
  [[nodiscard]] size_t connectCount() const;

 private:
  friend class FakeIPCListener;
  platform::Result<std::shared_ptr<platform::IPCConnection>> connectTo(const std::string& key, bool named);

  platform::Executor& executor_;
  mutable std::mutex mutex_;
  std::map<std::string, FakeIPCListener*> listeners_;
  platform::IPCPeer clientPeer_;
  size_t connectCount_ = 0;
  bool checksMessages_ = true;
};

/// An exported object that records its calls. `answer`, if set, is called for each of them, on the
/// connection's queue; otherwise the test answers through `ReceivedCall::reply`.
///
/// Threading: thread-safe.
class RecordingExportedObject final : public platform::IPCExportedObject {
 public:
  struct ReceivedCall {
    std::string member;
    platform::IPCArguments arguments;
    platform::IPCReply reply;
  };
  using Answer = std::function<void(const ReceivedCall&)>;

  explicit RecordingExportedObject(Answer answer = {}) : answer_(std::move(answer)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>& connection, const platform::IPCOperation& operation,
                  platform::IPCArguments arguments, platform::IPCReply reply) override;

  /// Removes and returns the oldest call; waits for it when calls come from another thread.
  ReceivedCall takeCall();
  [[nodiscard]] size_t callCount() const;
  [[nodiscard]] std::vector<std::string> members() const;

 private:
  const Answer answer_;
  mutable std::mutex mutex_;
  std::condition_variable condition_;
  std::deque<ReceivedCall> calls_;
};

}  // namespace qv::fakes
