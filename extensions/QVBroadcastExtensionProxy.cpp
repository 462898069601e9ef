#include "extensions/QVBroadcastExtensionProxy.h"

#include <csignal>
#include <utility>

#include "extensions/QVBroadcastProtocols.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::IPCArguments;
using platform::Platform;
using platform::URL;
namespace logs = platform::logs;

QVBroadcastExtensionProxy::QVBroadcastExtensionProxy()
    : queue_("com.tarnwick.quorveld.BroadcastExtensionProxy", *Platform::current().globalQueue) {}

std::shared_ptr<QVBroadcastExtensionProxy> QVBroadcastExtensionProxy::withBroadcastUploadExtension(
    platform::ExtensionRecordRef broadcastUploadExtension) {
  std::shared_ptr<QVBroadcastExtensionProxy> proxy(new QVBroadcastExtensionProxy());
  proxy->openListener(std::move(broadcastUploadExtension));
  return proxy;
}

platform::Result<std::shared_ptr<QVBroadcastExtensionProxy>>
QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(const platform::ListenerEndpoint& endpoint) {
  auto connection = Platform::current().ipc->connect(endpoint);
  if (!connection) return connection.error();
  std::shared_ptr<QVBroadcastExtensionProxy> proxy(new QVBroadcastExtensionProxy());
  proxy->takeConnection(*connection);
  return proxy;
}

QVBroadcastExtensionProxy::~QVBroadcastExtensionProxy() { invalidateConnection(); }

void QVBroadcastExtensionProxy::openListener(platform::ExtensionRecordRef extension) {
  auto listener = Platform::current().ipc->createAnonymousListener();
  listener->setDelegate(this, queue_);
  if (const auto error = listener->resume()) {
    QV_LOG_ERROR(logs::kExtensions, "no listener for the extension: %s", error->description().c_str());
  }
  std::lock_guard lock(mutex_);
  listenerEndpoint_ = listener->endpoint();
  listener_ = std::move(listener);
  broadcastUploadExtension_ = std::move(extension);
}

void QVBroadcastExtensionProxy::setServiceInfoHandler(std::function<void(const Dictionary&)> handler) {
  serviceInfoHandler_.store(std::move(handler));
}

void QVBroadcastExtensionProxy::setBroadcastURLHandler(std::function<void(const URL&)> handler) {
  broadcastURLHandler_.store(std::move(handler));
}

void QVBroadcastExtensionProxy::setErrorHandler(std::function<void(const Error&)> handler) {
  errorHandler_.store(std::move(handler));
}

bool QVBroadcastExtensionProxy::isCurrent(const WeakConnection& connection) {
  const auto strong = connection.lock();
  std::lock_guard lock(mutex_);
  return strong && strong == connection_;
}

void QVBroadcastExtensionProxy::payloadAnswered(const WeakConnection& connection,
                                                const BroadcastPayloadQueue::Completion& completion) {
  {
    const auto strong = connection.lock();
    std::lock_guard lock(mutex_);
    if (!strong || connection_ != strong) return;
    --inFlight_;
    sendPending();
  }
  if (completion) completion();
}

void QVBroadcastExtensionProxy::payloadFailed(const WeakConnection& connection, const Error& error) {
  if (!isCurrent(connection)) return;
  QV_LOG_ERROR(logs::kExtensions, "error getting remote proxy to extension: %i", static_cast<int>(error.code));
  reportLoss();
}

void QVBroadcastExtensionProxy::reportLoss() {
  {
    std::lock_guard lock(mutex_);
    if (std::exchange(isLossReported_, true)) return;
  }
  if (const auto handler = errorHandler_.load()) {
    handler(_qvUserErrorForCode(errorcode::kInvalidBroadcastSession, Dictionary{}));
  }
}

void QVBroadcastExtensionProxy::processPayload(BroadcastPayload payload, BroadcastPayloadQueue::Completion completion) {
  std::lock_guard lock(mutex_);
  if (!connection_) return;
  pending_.push({std::move(payload), std::move(completion)});
  logDrops();
  sendPending();
}

/// Sending only queues the message, so it can be done with the mutex held: that keeps the order.
void QVBroadcastExtensionProxy::sendPending() {
  while (connection_ && inFlight_ < kMaximumInFlight) {
    auto item = pending_.pop();
    if (!item) return;
    send(std::move(*item));
  }
}

void QVBroadcastExtensionProxy::send(BroadcastPayloadQueue::Item item) {
  Dictionary& entries = item.payload.entries;
  if (item.payload.kind == BroadcastPayload::Kind::Video) {
    auto frame = item.payload.frame.encodeForIPC();
    // Out of descriptors: this frame is lost, the next one may have one.
    if (frame.isNone()) return;
    entries.insert_or_assign(broadcastpayload::kSharedFrame, std::move(frame));
  }
  ++inFlight_;
  const WeakConnection weakConnection = connection_;
  connection_->call(
      "processPayload", {platform::Value(std::move(entries))},
      [weakSelf = weak_from_this(), weakConnection, completion = std::move(item.completion)](const IPCArguments&) {
        if (const auto self = weakSelf.lock()) self->payloadAnswered(weakConnection, completion);
      },
      [weakSelf = weak_from_this(), weakConnection](const Error& error) {
        if (const auto self = weakSelf.lock()) self->payloadFailed(weakConnection, error);
      });
}

/// Told as the number doubles, so that a slow extension does not fill the log.
void QVBroadcastExtensionProxy::logDrops() {
  const uint64_t drops = pending_.droppedFrames() + pending_.droppedAudio();
  if (drops == 0 || drops < 2 * loggedDrops_) return;
  loggedDrops_ = drops;
  QV_LOG(logs::kExtensions, "the broadcast extension does not keep up: %llu frames and %llu runs of sound dropped",
         static_cast<unsigned long long>(pending_.droppedFrames()),
         static_cast<unsigned long long>(pending_.droppedAudio()));
}

void QVBroadcastExtensionProxy::invalidateConnection() {
  QV_LOG(logs::kExtensions, "invalidating connection with extension");
  connectionReadyHandler_.store(nullptr);
  handshake_.store(nullptr);
  Connection connection;
  std::unique_ptr<platform::IPCListener> listener;
  platform::ExtensionRecordRef extension;
  BroadcastPayloadQueue dropped;
  {
    std::lock_guard lock(mutex_);
    connection.swap(connection_);
    listener.swap(listener_);
    extension.swap(broadcastUploadExtension_);
    std::swap(dropped, pending_);
    isLossReported_ = true;
    if (dropped.droppedFrames() + dropped.droppedAudio() > 0) {
      QV_LOG(logs::kExtensions, "broadcast ended with %llu frames and %llu runs of sound dropped",
             static_cast<unsigned long long>(dropped.droppedFrames()),
             static_cast<unsigned long long>(dropped.droppedAudio()));
    }
  }
  if (connection) {
    connection->setInvalidationHandler(nullptr);
    connection->setInterruptionHandler(nullptr);
    connection->invalidate();
  }
  if (listener) listener->invalidate();
  if (extension) Platform::current().extensions->killExtension(extension, SIGKILL);
}

}  // namespace qv
