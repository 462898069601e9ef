#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <set>

#include "extensions/BroadcastPayloadQueue.h"
#include "extensions/EarlyHandler.h"
#include "extensions/LinkHandshake.h"
#include "platform/Platform.h"
#include "platform/threads/RareLog.h"

namespace qv {

/// The link to a running broadcast extension: launches it, hands it the endpoint of an anonymous listener, takes its
/// connection, serves its calls and sends it payloads. Or it connects to an extension that already listens somewhere.
/// A launched extension's process is this link's own: links to one extension do not meet.
///
/// The recording never waits for the extension. At most `kMaximumInFlight` payloads are unanswered; what comes
/// meanwhile waits in a bounded queue. No pixel is copied: a frame's memory travels, with a lease.
///
/// An extension that calls more often than `kMaximumCallsPerSecond` is not listened to for the rest of that second, but
/// for its wish to end the broadcast.
///
/// Threading: thread-safe. The handlers that are set run on the link's own queue, never with a lock held; the others
/// run where they say.
class QVBroadcastExtensionProxy final : public platform::IPCListenerDelegate,
                                        public std::enable_shared_from_this<QVBroadcastExtensionProxy> {
 public:
  static constexpr size_t kMaximumInFlight = 4;
  static constexpr int kMaximumCallsPerSecond = 64;
  using ReadyHandler = LinkHandshake::Handler;

  /// For an extension that is to be launched. Nothing is until `establishConnectionWithHandler`.
  /// The platform is borrowed, and must outlive the link.
  static std::shared_ptr<QVBroadcastExtensionProxy> withBroadcastUploadExtension(
      const platform::Platform& platform, const platform::ExtensionRecordRef& broadcastUploadExtension);
  /// Connected at once to an extension that runs already and listens there; the error where it cannot be reached.
  static platform::Result<std::shared_ptr<QVBroadcastExtensionProxy>> withBroadcastUploadListenerEndpoint(
      const platform::Platform& platform, const platform::ListenerEndpoint& endpoint);
  ~QVBroadcastExtensionProxy() override;

  /// What came before they were set is told when they are: the latest of each.
  void setServiceInfoHandler(std::function<void(const platform::Dictionary&)> handler);
  void setBroadcastURLHandler(std::function<void(const platform::URL&)> handler);
  /// The extension wants to end the broadcast, or it is gone; told once. What happens before the link is ready is told
  /// to the ready handler instead.
  void setErrorHandler(std::function<void(const platform::Error&)> handler);

  /// Launches the extension and returns. The handler gets nothing at each "ping" of the extension; or an error, once,
  /// where there will be no ping: the launch or the handshake failed, the extension ended or gave up, 10 s passed, or
  /// this link was invalidated or destroyed (kInvalidBroadcastSession). So it is called in every case. It runs on any
  /// thread, in the last two cases within the call.
  void establishConnectionWithHandler(ReadyHandler handler);
  /// The handler (may be empty) gets the payload's outcome, once in every case. It runs on the link's queue when the
  /// extension has answered; for a payload that is given up, on any thread and perhaps within this call or
  /// `invalidateConnection`, so call with no lock held that it takes. Actions are given up with the link only, samples
  /// also where the extension does not keep up.
  void processPayload(BroadcastPayload payload, PayloadAnswer::Handler completion);
  /// Pictures that were given up because the extension does not keep up.
  [[nodiscard]] uint64_t droppedFrames() const;
  /// Ends the connection and kills the extension's process. When it returns, nothing is held any more: the waiting
  /// ready handler and the open payloads have been told, and the handlers that were set are let go without a call.
  void invalidateConnection();

  bool listenerShouldAcceptNewConnection(platform::IPCListener& listener,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override;

 private:
  class ExportedObject;
  using Connection = std::shared_ptr<platform::IPCConnection>;
  using WeakConnection = std::weak_ptr<platform::IPCConnection>;
  /// What goes with a connection: destroyed, it gives up every answer. Not under the mutex.
  struct Payloads {
    BroadcastPayloadQueue waiting;
    std::set<PayloadAnswerRef> inFlight;
  };

  explicit QVBroadcastExtensionProxy(const platform::Platform& platform);
  void takeConnection(const Connection& connection);
  void openListener(const platform::ExtensionRecordRef& extension);
  [[nodiscard]] bool isCurrent(const WeakConnection& connection);
  void lost(const platform::Error& error);

  // --- Handshake.
  void requestBegan(platform::ExtensionRequestID request, const std::optional<platform::Error>& error);
  void handOverEndpoint(platform::ExtensionRequestID request);
  void handshakeFailed(const platform::Error& error);
  [[nodiscard]] std::shared_ptr<LinkHandshake> handshake();

  // --- What the extension calls.
  void handleCall(const std::string& member, const platform::IPCArguments& arguments);
  [[nodiscard]] bool mayCall();
  void ping();
  void updateServiceInfo(const platform::Dictionary& serviceInfo);
  void updateBroadcastURL(const platform::URL& broadcastURL);
  void finishBroadcastWithError(const std::optional<platform::Error>& error);

  // --- Payloads. The mutex is held; what they return has to be let go of without it.
  BroadcastPayloadQueue::Items sendPending();
  [[nodiscard]] bool send(BroadcastPayloadQueue::Item& item);

  void logDrops(const BroadcastPayloadQueue::Items& dropped, const BroadcastPayloadQueue& waiting);
  void payloadAnswered(const std::weak_ptr<PayloadAnswer>& answer);
  void payloadFailed(const std::weak_ptr<PayloadAnswer>& answer, const platform::Error& error);
  void tellError(const platform::Error& error);

  const platform::Platform& platform_;
  platform::SerialQueue queue_;
  EarlyHandler<platform::Dictionary> serviceInfoHandler_;
  EarlyHandler<platform::URL> broadcastURLHandler_;
  EarlyHandler<platform::Error> errorHandler_;
  platform::RareLog drops_;

  mutable std::mutex mutex_;  ///< for all below
  std::unique_ptr<platform::IPCListener> listener_;
  std::shared_ptr<platform::ExtensionUse> use_;
  platform::ListenerEndpoint listenerEndpoint_;
  std::shared_ptr<LinkHandshake> handshake_;
  Connection connection_;
  Payloads payloads_;
  bool isErrorTold_ = false;

  // Link queue only.
  std::chrono::seconds callSecond_{0};
  int callsInSecond_ = 0;
};

}  // namespace qv
