#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>

#include "extensions/AnswerDeadline.h"
#include "extensions/BroadcastPayloadQueue.h"
#include "platform/Extensions.h"
#include "platform/Guarded.h"
#include "platform/IPC.h"

namespace qv {

/// The link to a running broadcast extension: launches it, hands it the endpoint of an anonymous listener, takes its
/// connection, serves its calls and sends it payloads. Or it connects to an extension that already listens somewhere.
///
/// The recording never waits for the extension. At most `kMaximumInFlight` payloads are unanswered; what comes
/// meanwhile waits in a bounded queue. No pixel is copied: a frame's memory travels, with a lease.
///
/// An extension that calls more often than `kMaximumCallsPerSecond` is not listened to for the rest of that second, but
/// for its wish to end the broadcast.
///
/// Threading: thread-safe. Handlers run on the link's own queue, never with a lock held.
class QVBroadcastExtensionProxy final : public platform::IPCListenerDelegate,
                                        public std::enable_shared_from_this<QVBroadcastExtensionProxy> {
 public:
  static constexpr size_t kMaximumInFlight = 4;
  static constexpr int kMaximumCallsPerSecond = 64;
  using ReadyHandler = std::function<void(const std::optional<platform::Error>&)>;

  /// For an extension that is to be launched. Nothing is until `establishConnectionWithHandler`.
  static std::shared_ptr<QVBroadcastExtensionProxy> withBroadcastUploadExtension(
      platform::ExtensionRecordRef broadcastUploadExtension);
  /// Connected at once to an extension that runs already and listens there; the error where it cannot be reached.
  static platform::Result<std::shared_ptr<QVBroadcastExtensionProxy>> withBroadcastUploadListenerEndpoint(
      const platform::ListenerEndpoint& endpoint);
  ~QVBroadcastExtensionProxy() override;

  void setServiceInfoHandler(std::function<void(const platform::Dictionary&)> handler);
  void setBroadcastURLHandler(std::function<void(const platform::URL&)> handler);
  /// The extension wants to end the broadcast, or it is gone. A loss is told once.
  void setErrorHandler(std::function<void(const platform::Error&)> handler);

  /// Launches the extension and returns. The handler gets nothing at each "ping" of the extension, and an error where
  /// the handshake fails or has not come to the first ping within 10 s.
  void establishConnectionWithHandler(ReadyHandler handler);
  /// The completion runs when the extension has answered, and never where it does not: not connected, dropped, failed.
  void processPayload(BroadcastPayload payload, BroadcastPayloadQueue::Completion completion);
  /// Ends the connection and kills the extension's process, without a call of any handler.
  void invalidateConnection();

  bool listenerShouldAcceptNewConnection(platform::IPCListener& listener,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override;

 private:
  class ExportedObject;
  using Connection = std::shared_ptr<platform::IPCConnection>;
  using WeakConnection = std::weak_ptr<platform::IPCConnection>;

  QVBroadcastExtensionProxy();
  void takeConnection(const Connection& connection);
  void openListener(platform::ExtensionRecordRef extension);
  [[nodiscard]] bool isCurrent(const WeakConnection& connection);

  // --- Handshake.
  void requestBegan(platform::ExtensionRequestID request, const std::optional<platform::Error>& error);
  void handOverEndpoint(platform::ExtensionRequestID request);
  void handshakeFailed(const platform::Error& error);

  // --- What the extension calls.
  void handleCall(const std::string& member, const platform::IPCArguments& arguments);
  [[nodiscard]] bool mayCall();
  void ping();
  void updateServiceInfo(const platform::Dictionary& serviceInfo);
  void updateBroadcastURL(const platform::URL& broadcastURL);
  void finishBroadcastWithError(const std::optional<platform::Error>& error);

  // --- Payloads. The mutex is held.
  void sendPending();
  void send(BroadcastPayloadQueue::Item item);
  void logDrops();

  void payloadAnswered(const WeakConnection& connection, const BroadcastPayloadQueue::Completion& completion);
  void payloadFailed(const WeakConnection& connection, const platform::Error& error);
  void reportLoss();

  platform::SerialQueue queue_;
  platform::Guarded<std::function<void(const platform::Dictionary&)>> serviceInfoHandler_;
  platform::Guarded<std::function<void(const platform::URL&)>> broadcastURLHandler_;
  platform::Guarded<std::function<void(const platform::Error&)>> errorHandler_;
  platform::Guarded<ReadyHandler> connectionReadyHandler_;
  platform::Guarded<std::shared_ptr<AnswerDeadline>> handshake_;

  std::mutex mutex_;  ///< for all below
  std::unique_ptr<platform::IPCListener> listener_;
  platform::ExtensionRecordRef broadcastUploadExtension_;
  platform::ListenerEndpoint listenerEndpoint_;
  Connection connection_;
  BroadcastPayloadQueue pending_;
  size_t inFlight_ = 0;
  uint64_t loggedDrops_ = 0;
  bool isLossReported_ = false;

  // Link queue only.
  std::chrono::seconds callSecond_{0};
  int callsInSecond_ = 0;
};

}  // namespace qv
