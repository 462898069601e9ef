#include <string_view>
#include <utility>

#include "extensions/QVBroadcastExtensionProxy.h"
#include "extensions/QVBroadcastProtocols.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::ExtensionRequestID;
using platform::IPCArguments;
using platform::Platform;
using platform::URL;
using platform::Value;
namespace logs = platform::logs;

namespace {
Error invalidBroadcastSession() { return _qvUserErrorForCode(errorcode::kInvalidBroadcastSession, Dictionary{}); }
}  // namespace

/// What the extension calls. It does not keep the proxy alive: its connection may, through this.
class QVBroadcastExtensionProxy::ExportedObject final : public platform::IPCExportedObject {
 public:
  explicit ExportedObject(std::weak_ptr<QVBroadcastExtensionProxy> proxy) : proxy_(std::move(proxy)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>& connection, const platform::IPCOperation& operation,
                  IPCArguments arguments, platform::IPCReply) override {
    const auto proxy = proxy_.lock();
    if (proxy && proxy->isCurrent(connection)) proxy->handleCall(operation.member, arguments);
  }

 private:
  const std::weak_ptr<QVBroadcastExtensionProxy> proxy_;
};

void QVBroadcastExtensionProxy::establishConnectionWithHandler(ReadyHandler handler) {
  QV_LOG(logs::kExtensions, "establishing connection to extension");
  connectionReadyHandler_.store(std::move(handler));
  handshake_.store(AnswerDeadline::start(kExtensionPatience, [weakSelf = weak_from_this()](bool isLate) {
    const auto self = weakSelf.lock();
    if (!self || !isLate) return;
    QV_LOG_ERROR(logs::kExtensions, "the extension did not connect and ping in time");
    self->handshakeFailed(invalidBroadcastSession());
  }));
  platform::ExtensionRecordRef extension;
  {
    std::lock_guard lock(mutex_);
    extension = broadcastUploadExtension_;
  }
  platform::ExtensionRequestHandlers handlers;
  handlers.began = [weakSelf = weak_from_this()](ExtensionRequestID request, const std::optional<Error>& error) {
    if (const auto self = weakSelf.lock()) self->requestBegan(request, error);
  };
  handlers.completed = [weakSelf = weak_from_this()](ExtensionRequestID, const auto& returned) {
    const auto self = weakSelf.lock();
    if (self && !returned) self->handshakeFailed(returned.error());
  };
  Platform::current().extensions->beginExtensionRequest(extension, {platform::ExtensionItem()}, std::move(handlers));
}

void QVBroadcastExtensionProxy::requestBegan(ExtensionRequestID request, const std::optional<Error>& error) {
  if (error) {
    QV_LOG_ERROR(logs::kExtensions, "Error beginning extension request: %i", static_cast<int>(error->code));
    handshakeFailed(*error);
    return;
  }
  QV_LOG(logs::kExtensions, "beginExtensionRequestWithInputItems returned");
  handOverEndpoint(request);
}

void QVBroadcastExtensionProxy::handOverEndpoint(ExtensionRequestID request) {
  const auto vendor = Platform::current().extensions->auxiliaryConnectionForRequest(request);
  const auto fail = [weakSelf = weak_from_this()](const Error&) {
    QV_LOG_ERROR(logs::kExtensions, "Error setting listenerEndpoint");
    if (const auto self = weakSelf.lock()) self->handshakeFailed(invalidBroadcastSession());
  };
  platform::ListenerEndpoint endpoint;
  {
    std::lock_guard lock(mutex_);
    endpoint = listenerEndpoint_;
  }
  if (!vendor || !endpoint.isValid()) {
    fail({});
    return;
  }
  vendor->call(
      "setEndpoint", {Value(endpoint.rendezvous())},
      [](const IPCArguments&) { QV_LOG(logs::kExtensions, "Remote endpoint set."); }, fail);
}

/// Once the extension has pinged, what becomes of its request means nothing to the handshake.
void QVBroadcastExtensionProxy::handshakeFailed(const Error& error) {
  const auto handshake = handshake_.exchange(nullptr);
  if (!handshake) return;
  handshake->answer();
  if (const auto handler = connectionReadyHandler_.exchange(nullptr)) handler(error);
}

/// Every connection is taken: only the launched extension knows the endpoint. A new one replaces the former.
bool QVBroadcastExtensionProxy::listenerShouldAcceptNewConnection(
    platform::IPCListener&, const std::shared_ptr<platform::IPCConnection>& connection) {
  if (weak_from_this().expired()) return false;
  takeConnection(connection);
  return true;
}

void QVBroadcastExtensionProxy::takeConnection(const Connection& connection) {
  connection->setExportedInterface(broadcastDaemonProtocol(), std::make_shared<ExportedObject>(weak_from_this()));
  connection->setRemoteInterface(broadcastExtensionProtocol());
  connection->setTargetQueue(queue_);
  const WeakConnection weakConnection = connection;
  connection->setInvalidationHandler([weakSelf = weak_from_this(), weakConnection] {
    const auto self = weakSelf.lock();
    if (!self || !self->isCurrent(weakConnection)) return;
    QV_LOG(logs::kExtensions, "connection to broadcast extension invalidated");
    self->reportLoss();
  });
  connection->setInterruptionHandler(
      [] { QV_LOG(logs::kExtensions, "connection to broadcast extension interrupted"); });
  Connection former;
  {
    std::lock_guard lock(mutex_);
    former = std::exchange(connection_, connection);
    inFlight_ = 0;
  }
  connection->resume();
}

void QVBroadcastExtensionProxy::handleCall(const std::string& member, const IPCArguments& arguments) {
  if (member == "finishBroadcastWithError") {
    finishBroadcastWithError(platform::decodeError(arguments.at(0).asDictionary()));
  } else if (!mayCall()) {
    return;
  } else if (member == "ping") {
    ping();
  } else if (member == "updateServiceInfo") {
    updateServiceInfo(arguments.at(0).asDictionary());
  } else if (member == "updateBroadcastURL") {
    updateBroadcastURL(URL(arguments.at(0).asString()));
  }
}

bool QVBroadcastExtensionProxy::mayCall() {
  const auto now = std::chrono::seconds(static_cast<int64_t>(Platform::current().clock->hostTime().seconds()));
  if (now != std::exchange(callSecond_, now)) callsInSecond_ = 0;
  if (callsInSecond_ == kMaximumCallsPerSecond) {
    QV_LOG_ERROR(logs::kExtensions, "the broadcast extension calls too often, some calls are ignored");
  }
  return callsInSecond_++ < kMaximumCallsPerSecond;
}

void QVBroadcastExtensionProxy::ping() {
  QV_LOG(logs::kExtensions, "received ping from extension, notifying handler that connection is ready");
  if (const auto handshake = handshake_.exchange(nullptr)) handshake->answer();
  if (const auto handler = connectionReadyHandler_.load()) handler(std::nullopt);
}

void QVBroadcastExtensionProxy::updateServiceInfo(const Dictionary& serviceInfo) {
  QV_LOG(logs::kExtensions, "received serviceInfo");
  if (const auto handler = serviceInfoHandler_.load()) handler(serviceInfo);
}

void QVBroadcastExtensionProxy::updateBroadcastURL(const URL& broadcastURL) {
  QV_LOG(logs::kExtensions, "received broadcastURL");
  if (const auto handler = broadcastURLHandler_.load()) handler(broadcastURL);
}

void QVBroadcastExtensionProxy::finishBroadcastWithError(const std::optional<Error>& error) {
  QV_LOG(logs::kExtensions, "received finish request from service due to error");
  if (const auto handler = errorHandler_.load()) handler(error.value_or(invalidBroadcastSession()));
}

}  // namespace qv
