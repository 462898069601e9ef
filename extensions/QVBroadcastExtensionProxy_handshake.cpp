#include <string_view>
#include <utility>

#include "extensions/QVBroadcastExtensionProxy.h"
#include "platform/Platform.h"
#include "platform/threads/Log.h"
#include "protocol/QVBroadcastProtocols.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::ExtensionRequestID;
using platform::IPCArguments;
using platform::URL;
using platform::Value;
namespace logs = platform::logs;

namespace {
Error invalidBroadcastSession() { return recordingError(errorcode::kInvalidBroadcastSession); }
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
  std::shared_ptr<LinkHandshake> current = LinkHandshake::start(platform_, std::move(handler)), former;
  std::shared_ptr<platform::ExtensionUse> use;
  {
    std::lock_guard lock(mutex_);
    former = std::exchange(handshake_, current);
    use = use_;
  }
  platform::ExtensionRequestHandlers handlers;
  handlers.began = [weakSelf = weak_from_this()](ExtensionRequestID request, const std::optional<Error>& error) {
    if (const auto self = weakSelf.lock()) self->requestBegan(request, error);
  };
  handlers.completed = [weakSelf = weak_from_this()](ExtensionRequestID, const auto& returned) {
    const auto self = weakSelf.lock();
    if (self) self->handshakeFailed(returned ? invalidBroadcastSession() : returned.error());
  };
  if (!use) return handshakeFailed(invalidBroadcastSession());
  use->beginRequest({platform::ExtensionItem()}, std::move(handlers));
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
  const auto vendor = platform_.extensions->auxiliaryConnectionForRequest(request);
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

std::shared_ptr<LinkHandshake> QVBroadcastExtensionProxy::handshake() {
  std::lock_guard lock(mutex_);
  return handshake_;
}

/// Once the extension has pinged, what becomes of its request means nothing: the connection tells of its end.
void QVBroadcastExtensionProxy::handshakeFailed(const Error& error) {
  if (const auto waiting = handshake()) waiting->fail(error);
}

/// Every connection is taken: only the launched extension knows the endpoint. A new one replaces the former.
bool QVBroadcastExtensionProxy::listenerShouldAcceptNewConnection(
    platform::IPCListener&, const std::shared_ptr<platform::IPCConnection>& connection) {
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
    self->lost(invalidBroadcastSession());
  });
  connection->setInterruptionHandler(
      [] { QV_LOG(logs::kExtensions, "connection to broadcast extension interrupted"); });
  Connection former;
  Payloads givenUp;
  {
    std::lock_guard lock(mutex_);
    former = std::exchange(connection_, connection);
    std::swap(givenUp, payloads_);
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
  const auto now = std::chrono::seconds(static_cast<int64_t>(platform_.clock->hostTime().seconds()));
  if (now != std::exchange(callSecond_, now)) callsInSecond_ = 0;
  if (callsInSecond_ == kMaximumCallsPerSecond) {
    QV_LOG_ERROR(logs::kExtensions, "the broadcast extension calls too often, some calls are ignored");
  }
  return callsInSecond_++ < kMaximumCallsPerSecond;
}

void QVBroadcastExtensionProxy::ping() {
  QV_LOG(logs::kExtensions, "received ping from extension, notifying handler that connection is ready");
  if (const auto waiting = handshake()) waiting->succeed();
}

void QVBroadcastExtensionProxy::updateServiceInfo(const Dictionary& serviceInfo) {
  QV_LOG(logs::kExtensions, "received serviceInfo");
  serviceInfoHandler_.tell(serviceInfo);
}

void QVBroadcastExtensionProxy::updateBroadcastURL(const URL& broadcastURL) {
  QV_LOG(logs::kExtensions, "received broadcastURL");
  broadcastURLHandler_.tell(broadcastURL);
}

void QVBroadcastExtensionProxy::finishBroadcastWithError(const std::optional<Error>& error) {
  QV_LOG(logs::kExtensions, "received finish request from service due to error");
  tellError(error.value_or(invalidBroadcastSession()));
}

}  // namespace qv
