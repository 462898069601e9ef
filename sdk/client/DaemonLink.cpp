#include "sdk/client/DaemonLink.h"

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"
#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "sdk/client/RecorderErrors.h"

namespace qv::client {

using platform::IPCArguments;

DaemonLink::DaemonLink(platform::IPCService& ipc, platform::TimerService& timers,
                       std::shared_ptr<platform::SerialQueue> queue, Interfaces interfaces, Delegate delegate)
    : ipc_(ipc),
      timers_(timers),
      queue_(std::move(queue)),
      interfaces_(std::move(interfaces)),
      delegate_(std::move(delegate)) {}

bool DaemonLink::ensureConnected() {
  queue_->assertOnQueue();
  if (connection_) return true;
  if (closed_) return false;
  auto connection = ipc_.connect(kServiceName);
  if (!connection) {
    QV_LOG_INFO(platform::logs::kIPC, "no connection to %s: %s", kServiceName,
                connection.error().description().c_str());
    return false;
  }
  connection_ = std::move(*connection);
  const uint64_t generation = ++generation_;
  auto onLoss = [weak = weak_from_this(), generation] {
    if (const auto self = weak.lock()) self->lose(generation);
  };
  connection_->setTargetQueue(*queue_);
  if (interfaces_.callbacks) connection_->setExportedInterface(clientProtocol(), interfaces_.callbacks);
  connection_->setRemoteInterface(interfaces_.remote);
  connection_->setInterruptionHandler(onLoss);
  connection_->setInvalidationHandler(onLoss);
  connection_->resume();
  connectedSince_ = std::chrono::steady_clock::now();
  retry_.reset();
  delegate_.connected();
  return true;
}

void DaemonLink::request(OutgoingCall call, Completion completion, FailureHandler onFailure) {
  if (!ensureConnected()) return onFailure(libraryError(quorvel::kErrorConnectionInvalid));
  const uint64_t identifier = ++lastRequest_;
  outstanding_[identifier] = std::move(onFailure);
  const size_t replyCount = interfaces_.remote.operation(call.member)->reply->size();
  auto completed = [weak = weak_from_this(), identifier, replyCount,
                    completion = std::move(completion)](const IPCArguments& reply) {
    if (const auto self = weak.lock()) {
      self->nextRetry_ = kFirstRetry;
      self->endRequest(identifier, [&](const FailureHandler& fail) {
        reply.size() == replyCount ? completion(reply) : fail(libraryError(quorvel::kErrorUnknown, "malformed reply"));
      });
    }
  };
  auto failed = [weak = weak_from_this(), identifier](const platform::Error& error) {
    if (const auto self = weak.lock())
      self->endRequest(identifier, [&](const FailureHandler& fail) { fail(errorForFailedCall(error)); });
  };
  connection_->call(call.member, std::move(call.arguments), std::move(completed), std::move(failed));
}

void DaemonLink::send(OutgoingCall call, FailureHandler onFailure) {
  if (!ensureConnected()) return onFailure(libraryError(quorvel::kErrorConnectionInvalid));
  auto failed = [weak = weak_from_this(), onFailure = std::move(onFailure)](const platform::Error& error) {
    const auto self = weak.lock();
    if (self && !self->closed_) onFailure(errorForFailedCall(error));
  };
  connection_->call(call.member, std::move(call.arguments), {}, std::move(failed));
}

void DaemonLink::endRequest(uint64_t identifier, const std::function<void(const FailureHandler&)>& end) {
  const auto it = outstanding_.find(identifier);
  if (it == outstanding_.end()) return;
  const FailureHandler fail = std::move(it->second);
  outstanding_.erase(it);
  end(fail);
}

void DaemonLink::lose(uint64_t generation) {
  queue_->assertOnQueue();
  if (closed_ || generation != generation_ || !connection_) return;
  connection_.reset();
  if (std::chrono::steady_clock::now() - connectedSince_ > kLongestRetry) nextRetry_ = kFirstRetry;
  for (const auto& [identifier, fail] : std::exchange(outstanding_, {}))
    fail(libraryError(quorvel::kErrorConnectionInterrupted));
  delegate_.lost();
  if (keepsConnected_) tryAgainLater();
}

void DaemonLink::setKeepsConnected(bool keep) {
  if (closed_) return;
  keepsConnected_ = keep;
  retry_.reset();
  nextRetry_ = kFirstRetry;
  if (keep && !ensureConnected()) tryAgainLater();
}

void DaemonLink::tryAgainLater() {
  retry_ = timers_.after(nextRetry_, [weak = weak_from_this(), queue = queue_] {
    queue->async(weak, [](DaemonLink& link) {
      if (link.keepsConnected_ && !link.closed_ && !link.ensureConnected()) link.tryAgainLater();
    });
  });
  nextRetry_ = std::min(nextRetry_ * 2, kLongestRetry);
}

void DaemonLink::close() {
  closed_ = true;
  keepsConnected_ = false;
  retry_.reset();
  outstanding_.clear();
  if (!connection_) return;
  connection_->setInterruptionHandler({});
  connection_->setInvalidationHandler({});
  connection_->invalidate();
  connection_.reset();
}

}  // namespace qv::client
