#include "platform/sdbus/BusErrors.h"
#include "platform/sdbus/BusLink.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {

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
  remotes_.push_back(std::move(table));
}

void BusLink::call(std::string_view member, IPCArguments arguments, IPCConnection::Completion completion,
                   IPCConnection::ErrorHandler errorHandler) {
  const MessageCost cost = costOf(arguments);
  std::lock_guard lock(mutex_);
  const IPCOperation* operation = remotes_.empty() ? nullptr : remotes_.back()->operation(member);
  if (ended_) {
    failOnQueue(std::move(errorHandler), ipcError(IPCErrorCode::ConnectionInvalid, "the connection has ended"));
  } else if (!operation) {
    failOnQueue(std::move(errorHandler),
                ipcError(IPCErrorCode::UnknownOperation, "no operation " + std::string(member)));
  } else {
    const bool isFrame = operation->isMedia && cost.descriptors > 0;
    // Control messages are acknowledged so that their failures are noticed, frames so that those
    // that the peer holds can be counted.
    const bool expectsReply = operation->reply || completion || !operation->isMedia || isFrame;
    addCall(*operation, std::move(arguments), cost,
            {operation, std::move(completion), std::move(errorHandler), isFrame, expectsReply});
  }
}

void BusLink::addCall(const IPCOperation& operation, IPCArguments arguments, const MessageCost& cost,
                      PendingCall call) {
  if (operation.isMedia && !admitsMedia(cost, call.expectsReply)) {
    if (droppedMedia_++ == 0) QV_LOG(logs::kIPC, "peer does not keep up: dropping %s", operation.member.c_str());
    failOnQueue(std::move(call.errorHandler), ipcError(IPCErrorCode::MessageDropped, "the peer does not keep up"));
    return;
  }
  const uint64_t id = ++lastCall_;
  Outgoing message{Outgoing::Kind::Call, id, &operation, std::move(arguments), call.expectsReply, {}, {}, cost.bytes,
                   cost.descriptors > 0};
  if (call.isFrame) {
    ++framesInFlight_;
  } else if (operation.isMedia && call.expectsReply) {
    ++mediaCallsInFlight_;
  }
  // In the table first: a full outbox fails every call in it, this one too.
  calls_.emplace(id, std::move(call));
  push(std::move(message));
}

bool BusLink::admitsMedia(const MessageCost& cost, bool expectsReply) const {
  const SdBusIPCOptions& bounds = context_->options;
  if (cost.descriptors > 0) {
    if (framesInFlight_ >= bounds.maximumFramesInFlight) return false;
  } else if (expectsReply && mediaCallsInFlight_ >= bounds.maximumMediaCallsInFlight) {
    return false;
  }
  // A message larger than the bound still passes when nothing else waits.
  return queuedMediaBytes_ == 0 || queuedMediaBytes_ + cost.bytes <= bounds.maximumQueuedMediaBytes;
}

void BusLink::answer(uint64_t token, IPCArguments values) {
  const MessageCost cost = costOf(values);
  pushAnswer(
      {Outgoing::Kind::Answer, token, nullptr, std::move(values), false, {}, {}, cost.bytes, cost.descriptors > 0});
}

void BusLink::answerError(uint64_t token, std::string name, std::string message) {
  const size_t bytes = name.size() + message.size();
  pushAnswer({Outgoing::Kind::ErrorAnswer, token, nullptr, {}, false, std::move(name), std::move(message), bytes});
}

void BusLink::pushAnswer(Outgoing message) {
  std::lock_guard lock(mutex_);
  if (!ended_) push(std::move(message));
}

bool BusLink::push(Outgoing message) {
  constexpr size_t kHeaderBytes = 256;  // about what sd-bus adds
  message.bytes += kHeaderBytes;
  if (queuedBytes_ + message.bytes > context_->options.maximumQueuedBytes) {
    QV_LOG_ERROR(logs::kIPC, "peer does not read: %zu bytes queued, ending the connection", queuedBytes_);
    endLocked(End::Overflow);
    postToSelf(&BusLink::close);
    return false;
  }
  queuedBytes_ += message.bytes;
  if (message.operation && message.operation->isMedia) queuedMediaBytes_ += message.bytes;
  outbox_.push_back(std::move(message));
  scheduleFlush();
  return true;
}

void BusLink::scheduleFlush() {
  if (flushScheduled_) return;
  flushScheduled_ = true;
  postToSelf(&BusLink::flush);
}

void BusLink::postToSelf(void (BusLink::*work)()) {
  context_->io.post([self = shared_from_this(), work] { ((*self).*work)(); });
}

void BusLink::failOnQueue(IPCConnection::ErrorHandler handler, Error error) {
  if (!handler) return;
  queue_->async([handler = std::move(handler), error = std::move(error)] { handler(error); });
}

std::optional<BusLink::PendingCall> BusLink::takeCall(uint64_t id) {
  const auto it = calls_.find(id);
  if (it == calls_.end()) return std::nullopt;
  PendingCall call = std::move(it->second);
  calls_.erase(it);
  if (call.isFrame) {
    --framesInFlight_;
  } else if (call.operation->isMedia && call.expectsReply) {
    --mediaCallsInFlight_;
  }
  return call;
}

void BusLink::invalidate(bool tellOwner) {
  std::lock_guard lock(mutex_);
  if (ended_) return;
  endLocked(tellOwner ? End::Invalidated : End::Destroyed);
  postToSelf(&BusLink::drain);
}

/// Everything that the queue still gets from this link is queued here, under the lock: afterwards
/// the queue may go.
void BusLink::endLocked(End end) {
  if (ended_) return;
  ended_ = true;
  std::vector<uint64_t> ids;
  for (const auto& [id, call] : calls_) ids.push_back(id);
  std::sort(ids.begin(), ids.end());
  for (const uint64_t id : ids) {
    failOnQueue(takeCall(id)->errorHandler, ipcError(IPCErrorCode::ConnectionInvalid, "the connection has ended"));
  }
  if (end == End::Lost || end == End::Overflow) outbox_.clear();
  if (end == End::Destroyed) return;
  const bool mayReturn = end == End::Lost && role_ == Role::NamedConnector;
  queue_->async(owner_, [mayReturn](BusLinkOwner& owner) { owner.linkEnded(mayReturn); });
}

}  // namespace qv::platform::sdbus
