#include "platform/sdbus/BusLink.h"

#include <utility>

#include "platform/sdbus/BusErrors.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {
namespace {

BusDriver::Side sideOf(BusLink::Role role) {
  return role == BusLink::Role::Accepted ? BusDriver::Side::Server : BusDriver::Side::Client;
}

}  // namespace

BusLink::BusLink(std::shared_ptr<IPCContext> context, FileDescriptor socket, Role role)
    : role_(role),
      driver_(std::make_shared<BusDriver>(std::move(context), std::move(socket), sideOf(role))),
      queue_(std::make_shared<SerialQueue>("com.tarnwick.quorveld.connection")) {}

void BusLink::setQueue(std::shared_ptr<SerialQueue> queue) {
  std::lock_guard lock(mutex_);
  queue_ = std::move(queue);
}

void BusLink::setOwner(std::weak_ptr<BusLinkOwner> owner) {
  std::lock_guard lock(mutex_);
  owner_ = std::move(owner);
}

void BusLink::setRemoteInterface(const IPCInterface& interface) {
  auto table = InterfaceTable::shared(interface);
  std::lock_guard lock(mutex_);
  remote_ = std::move(table);
}

void BusLink::call(std::string_view member, IPCArguments arguments, IPCConnection::Completion completion,
                   IPCConnection::ErrorHandler errorHandler) {
  const MessageCost cost = costOf(arguments);
  PendingCall call{std::move(completion), std::move(errorHandler), {}};
  std::lock_guard lock(mutex_);
  const IPCOperation* operation = remote_ ? remote_->operation(member) : nullptr;
  if (ended_) {
    failOnQueue(std::move(call), IPCErrorCode::ConnectionInvalid, "the connection has ended");
  } else if (!operation) {
    failOnQueue(std::move(call), IPCErrorCode::UnknownOperation, "no operation " + std::string(member));
  } else {
    addCall(*operation, std::move(arguments), cost, std::move(call));
  }
}

void BusLink::addCall(const IPCOperation& operation, IPCArguments arguments, const MessageCost& cost,
                      PendingCall call) {
  const bool isFrame = operation.isMedia && cost.descriptors > 0;
  // Control messages are acknowledged so that their failures are noticed, frames so that those
  // that the peer holds can be counted.
  const bool expectsReply = operation.reply || call.completion || !operation.isMedia || isFrame;
  if (operation.isMedia) {
    auto slot = driver_->outbox().admitMedia(cost, expectsReply);
    if (!slot) {
      if (!std::exchange(hasDroppedMedia_, true)) {
        QV_LOG(logs::kIPC, "peer does not keep up: dropping %s", operation.member.c_str());
      }
      return failOnQueue(std::move(call), IPCErrorCode::MessageDropped, "the peer does not keep up");
    }
    call.slot = std::move(*slot);
  }
  const uint64_t id = ++lastCall_;
  // In the table first: a full outbox fails every call in it, this one too.
  calls_.emplace(id, std::move(call));
  push(OutgoingCall{id, remote_, &operation, std::move(arguments), expectsReply}, cost);
}

void BusLink::answer(OutgoingAnswer answer) {
  const MessageCost cost = costOf(answer.values);
  std::lock_guard lock(mutex_);
  if (!ended_) push(std::move(answer), cost);
}

void BusLink::answer(OutgoingError error) {
  const MessageCost cost{error.name.size() + error.message.size(), 0};
  std::lock_guard lock(mutex_);
  if (!ended_) push(std::move(error), cost);
}

void BusLink::push(OutgoingMessage message, const MessageCost& cost) {
  if (driver_->outbox().push(std::move(message), cost)) return driver_->flushSoon();
  QV_LOG_ERROR(logs::kIPC, "peer does not read: too much is queued for it, ending the connection");
  endLocked(End::Overflow);
  driver_->closeSoon();
}

void BusLink::failOnQueue(PendingCall call, IPCErrorCode code, const std::string& text) {
  if (!call.errorHandler && !call.completion) return;
  queue_->async(
      [handler = std::move(call.errorHandler), completion = std::move(call.completion), error = ipcError(code, text)] {
        if (handler) handler(error);
      });
}

void BusLink::invalidate(bool tellOwner) {
  std::lock_guard lock(mutex_);
  if (ended_) return;
  endLocked(tellOwner ? End::Invalidated : End::Destroyed);
  driver_->drainAndClose();
}

/// Everything that the queue still gets from this link is queued here, under the lock: afterwards
/// the queue may go.
void BusLink::endLocked(End end) {
  if (ended_) return;
  ended_ = true;
  for (auto& [id, call] : std::exchange(calls_, {})) {
    failOnQueue(std::move(call), IPCErrorCode::ConnectionInvalid, "the connection has ended");
  }
  if (end == End::Lost || end == End::Overflow) driver_->outbox().clear();
  if (end == End::Destroyed) return;
  const bool mayReturn = end == End::Lost && role_ == Role::NamedConnector;
  queue_->async(owner_, [mayReturn](BusLinkOwner& owner) { owner.linkEnded(mayReturn); });
}

}  // namespace qv::platform::sdbus
