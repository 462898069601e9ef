#include "extensions/QVBroadcastExtensionProxy.h"

#include <utility>

#include "platform/threads/Log.h"
#include "protocol/QVBroadcastProtocols.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::IPCArguments;
using platform::URL;
namespace logs = platform::logs;

QVBroadcastExtensionProxy::QVBroadcastExtensionProxy(const platform::Platform& platform)
    : platform_(platform), queue_("com.tarnwick.quorveld.BroadcastExtensionProxy", *platform.globalQueue) {}

std::shared_ptr<QVBroadcastExtensionProxy> QVBroadcastExtensionProxy::withBroadcastUploadExtension(
    const platform::Platform& platform, const platform::ExtensionRecordRef& broadcastUploadExtension) {
  std::shared_ptr<QVBroadcastExtensionProxy> proxy(new QVBroadcastExtensionProxy(platform));
  proxy->openListener(broadcastUploadExtension);
  return proxy;
}

platform::Result<std::shared_ptr<QVBroadcastExtensionProxy>>
QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(const platform::Platform& platform,
                                                               const platform::ListenerEndpoint& endpoint) {
  auto connection = platform.ipc->connect(endpoint);
  if (!connection) return connection.error();
  std::shared_ptr<QVBroadcastExtensionProxy> proxy(new QVBroadcastExtensionProxy(platform));
  proxy->takeConnection(*connection);
  return proxy;
}

QVBroadcastExtensionProxy::~QVBroadcastExtensionProxy() { invalidateConnection(); }

void QVBroadcastExtensionProxy::openListener(const platform::ExtensionRecordRef& extension) {
  auto listener = platform_.ipc->createAnonymousListener();
  listener->setDelegate(this, queue_);
  if (const auto error = listener->resume()) {
    QV_LOG_ERROR(logs::kExtensions, "no listener for the extension: %s", error->description().c_str());
  }
  std::lock_guard lock(mutex_);
  listenerEndpoint_ = listener->endpoint();
  listener_ = std::move(listener);
  use_ = platform_.extensions->useExtension(extension);
}

void QVBroadcastExtensionProxy::setServiceInfoHandler(std::function<void(const Dictionary&)> handler) {
  serviceInfoHandler_.set(std::move(handler));
  queue_.async(weak_from_this(), [](auto& self) { self.serviceInfoHandler_.tellWaiting(); });
}

void QVBroadcastExtensionProxy::setBroadcastURLHandler(std::function<void(const URL&)> handler) {
  broadcastURLHandler_.set(std::move(handler));
  queue_.async(weak_from_this(), [](auto& self) { self.broadcastURLHandler_.tellWaiting(); });
}

void QVBroadcastExtensionProxy::setErrorHandler(std::function<void(const Error&)> handler) {
  errorHandler_.set(std::move(handler));
  queue_.async(weak_from_this(), [](auto& self) { self.errorHandler_.tellWaiting(); });
}

bool QVBroadcastExtensionProxy::isCurrent(const WeakConnection& connection) {
  const auto strong = connection.lock();
  std::lock_guard lock(mutex_);
  return strong && strong == connection_;
}

/// Nothing can be sent any more: what waits for an answer gets none.
void QVBroadcastExtensionProxy::lost(const Error& error) {
  Connection connection;
  Payloads givenUp;
  {
    std::lock_guard lock(mutex_);
    connection.swap(connection_);
    std::swap(givenUp, payloads_);
  }
  tellError(error);
}

/// To whoever waits for the link, else to who watches it; once.
void QVBroadcastExtensionProxy::tellError(const Error& error) {
  const auto waiting = handshake();
  {
    std::lock_guard lock(mutex_);
    if (std::exchange(isErrorTold_, true)) return;
  }
  if (waiting) waiting->fail(error);
  if (waiting && !waiting->isReady()) return;
  errorHandler_.tell(error);
}

void QVBroadcastExtensionProxy::payloadAnswered(const std::weak_ptr<PayloadAnswer>& answer) {
  const auto answered = answer.lock();
  if (!answered) return;
  BroadcastPayloadQueue::Items unsendable;
  {
    std::lock_guard lock(mutex_);
    if (payloads_.inFlight.erase(answered) == 0) return;
    unsendable = sendPending();
  }
  answered->give(PayloadOutcome::Answered);
}

void QVBroadcastExtensionProxy::payloadFailed(const std::weak_ptr<PayloadAnswer>& answer, const Error& error) {
  if (answer.expired()) return;
  QV_LOG_ERROR(logs::kExtensions, "error getting remote proxy to extension: %i", static_cast<int>(error.code));
  lost(recordingError(errorcode::kInvalidBroadcastSession));
}

void QVBroadcastExtensionProxy::processPayload(BroadcastPayload payload, PayloadAnswer::Handler completion) {
  BroadcastPayloadQueue::Item item{std::move(payload), std::make_shared<PayloadAnswer>(std::move(completion))};
  BroadcastPayloadQueue::Items dropped, unsendable;
  std::lock_guard lock(mutex_);
  if (!connection_) return;
  dropped = payloads_.waiting.push(std::move(item));
  logDrops(dropped, payloads_.waiting);
  unsendable = sendPending();
}

uint64_t QVBroadcastExtensionProxy::droppedFrames() const {
  std::lock_guard lock(mutex_);
  return payloads_.waiting.droppedFrames();
}

/// Sending only queues the message, so it can be done with the mutex held: that keeps the order.
BroadcastPayloadQueue::Items QVBroadcastExtensionProxy::sendPending() {
  BroadcastPayloadQueue::Items unsendable;
  while (connection_ && payloads_.inFlight.size() < kMaximumInFlight) {
    auto item = payloads_.waiting.pop();
    if (!item) break;
    if (!send(*item)) unsendable.push_back(std::move(*item));
  }
  return unsendable;
}

bool QVBroadcastExtensionProxy::send(BroadcastPayloadQueue::Item& item) {
  Dictionary& entries = item.payload.entries;
  if (item.payload.kind == BroadcastPayload::Kind::Video) {
    auto frame = item.payload.frame.encodeForIPC();
    // Out of descriptors: this frame is lost, the next one may have one.
    if (frame.isNone()) return false;
    entries.insert_or_assign(broadcastpayload::kSharedFrame, std::move(frame));
  }
  // The call knows the answer only weakly: given up, it is dead there.
  const std::weak_ptr<PayloadAnswer> answer = *payloads_.inFlight.insert(std::move(item.answer)).first;
  connection_->call(
      "processPayload", {platform::Value(std::move(entries))},
      [weakSelf = weak_from_this(), answer](const IPCArguments&) {
        if (const auto self = weakSelf.lock()) self->payloadAnswered(answer);
      },
      [weakSelf = weak_from_this(), answer](const Error& error) {
        if (const auto self = weakSelf.lock()) self->payloadFailed(answer, error);
      });
  return true;
}

void QVBroadcastExtensionProxy::logDrops(const BroadcastPayloadQueue::Items& dropped,
                                         const BroadcastPayloadQueue& waiting) {
  if (dropped.empty() || !drops_.count(dropped.size())) return;
  QV_LOG(logs::kExtensions, "the broadcast extension does not keep up: %llu frames and %llu runs of sound dropped",
         static_cast<unsigned long long>(waiting.droppedFrames()),
         static_cast<unsigned long long>(waiting.droppedAudio()));
}

void QVBroadcastExtensionProxy::invalidateConnection() {
  QV_LOG(logs::kExtensions, "invalidating connection with extension");
  serviceInfoHandler_.close();
  broadcastURLHandler_.close();
  errorHandler_.close();
  Connection connection;
  std::unique_ptr<platform::IPCListener> listener;
  std::shared_ptr<platform::ExtensionUse> use;
  std::shared_ptr<LinkHandshake> handshake;
  Payloads givenUp;
  {
    std::lock_guard lock(mutex_);
    connection.swap(connection_);
    listener.swap(listener_);
    use.swap(use_);
    handshake.swap(handshake_);
    std::swap(givenUp, payloads_);
    listenerEndpoint_ = {};
  }
  if (givenUp.waiting.droppedFrames() + givenUp.waiting.droppedAudio() > 0) {
    QV_LOG(logs::kExtensions, "broadcast ended with %llu frames and %llu runs of sound dropped",
           static_cast<unsigned long long>(givenUp.waiting.droppedFrames()),
           static_cast<unsigned long long>(givenUp.waiting.droppedAudio()));
  }
  if (connection) connection->invalidate();
  listener.reset();
  use.reset();
  if (handshake) handshake->fail(recordingError(errorcode::kInvalidBroadcastSession));
}

}  // namespace qv
