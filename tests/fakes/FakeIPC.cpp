#include "tests/fakes/FakeIPC.h"

#include "platform/base/WireForm.h"

namespace qv::fakes {

using platform::Error;
using platform::IPCArguments;
using platform::IPCErrorCode;
using platform::IPCOperation;
using platform::IPCPeer;
using platform::IPCReply;
using platform::Result;
using platform::SerialQueue;

namespace {

Error localError(IPCErrorCode code, const std::string& message) {
  return {platform::kIPCErrorDomain,
          static_cast<int64_t>(code),
          {{platform::kLocalizedDescriptionKey, platform::Value(message)}}};
}

/// An error reply, sorted as the real messaging does.
Error errorReply(const std::string& name, const std::string& message) {
  using Code = platform::IPCErrorCode;
  const Code code = name == kNoReplyErrorName         ? Code::NoReply
                    : name == kUnknownMethodErrorName ? Code::UnknownOperation
                                                      : Code::RemoteError;
  Error error = localError(code, message);
  error.userInfo[platform::kIPCRemoteErrorNameKey] = platform::Value(name);
  return error;
}

/// The values as their signatures carry them, or nothing where one has no form in its.
std::optional<IPCArguments> argumentsFor(const IPCArguments& values, const std::vector<std::string>& signatures) {
  platform::ValueAssembly received;
  if (platform::writeForms(received, signatures, values) < 0) return std::nullopt;
  return received.take();
}

/// Sends the one answer of a call, or the error that stands for none.
class ReplySink final : public IPCReply::Sink {
 public:
  using Answer = std::function<void(const Result<IPCArguments>&)>;
  explicit ReplySink(Answer answer) : answer_(std::move(answer)) {}
  ~ReplySink() override { ReplySink::fail(kNoReplyErrorName, "the call was not answered"); }

  void succeed(IPCArguments values) override { end(std::move(values)); }
  void fail(std::string errorName, std::string message) override { end(errorReply(errorName, message)); }

 private:
  void end(const Result<IPCArguments>& with) {
    if (const Answer answer = std::exchange(answer_, {})) answer(with);
  }
  Answer answer_;
};

}  // namespace

FakeIPCConnection::FakeIPCConnection(platform::Executor& executor, IPCPeer peer, bool named)
    : peer_(std::move(peer)),
      named_(named),
      queue_(std::make_unique<SerialQueue>(named ? "fake named connection" : "fake connection", executor)) {}

FakeIPCConnection::Pair FakeIPCConnection::makePair(platform::Executor& executor, IPCPeer peer, bool named) {
  Pair ends{std::make_shared<FakeIPCConnection>(executor, IPCPeer(), named),
            std::make_shared<FakeIPCConnection>(executor, std::move(peer), false)};
  ends.first->other_ = ends.second;
  ends.second->other_ = ends.first;
  return ends;
}

void FakeIPCConnection::setTargetQueue(SerialQueue& queue) {
  queue_ = std::make_unique<SerialQueue>("fake connection", queue);
}

void FakeIPCConnection::resume() {
  resumed_ = true;
  for (auto& work : std::exchange(inbox_, {})) queue_->async(std::move(work));
}

void FakeIPCConnection::sendToOther(Delivery delivery) {
  if (const auto other = other_.lock()) other->deliver(std::move(delivery));
}

void FakeIPCConnection::deliver(Delivery delivery) {
  auto work = [weak = weak_from_this(), delivery = std::move(delivery)] {
    if (const auto self = weak.lock()) delivery(*self);
  };
  if (resumed_) {
    queue_->async(std::move(work));
  } else {
    inbox_.emplace_back(std::move(work));
  }
}

void FakeIPCConnection::call(std::string_view member, IPCArguments arguments, Completion completion,
                             ErrorHandler errorHandler) {
  const std::string name(member);
  const auto refuse = [&](IPCErrorCode code) {
    if (errorHandler) queue_->async([errorHandler, error = localError(code, name)] { errorHandler(error); });
  };
  if (ended_) return refuse(IPCErrorCode::ConnectionInvalid);
  const IPCOperation* operation = remoteInterface_.operation(member);
  if (!operation) return refuse(IPCErrorCode::UnknownOperation);
  if (dropsMedia_ && operation->isMedia) return refuse(IPCErrorCode::MessageDropped);
  auto typed = argumentsFor(arguments, operation->arguments);
  if (!typed) return refuse(IPCErrorCode::InvalidArguments);
  const uint64_t serial = nextSerial_++;
  pending_[serial] = {operation->reply, std::move(completion), std::move(errorHandler)};
  sendToOther([interface = remoteInterface_.name, name, typed = std::move(*typed), serial](FakeIPCConnection& to) {
    to.receiveCall(interface, name, typed, serial);
  });
}

void FakeIPCConnection::receiveCall(const std::string& interface, const std::string& member, IPCArguments arguments,
                                    uint64_t serial) {
  if (ended_) return;
  auto answer = [weak = weak_from_this(), serial](const Result<IPCArguments>& with) {
    const auto self = weak.lock();
    if (self) self->sendToOther([serial, with](FakeIPCConnection& caller) { caller.receiveAnswer(serial, with); });
  };
  const Exported exported = exported_[interface];
  const IPCOperation* operation = exported.interface.operation(member);
  if (!operation || !exported.object) return answer(errorReply(kUnknownMethodErrorName, member));
  IPCReply reply;
  if (operation->reply) {
    reply = IPCReply(std::make_shared<ReplySink>(answer));
  } else {
    answer(IPCArguments{});
  }
  exported.object->handleCall(shared_from_this(), *operation, std::move(arguments), std::move(reply));
}

void FakeIPCConnection::receiveAnswer(uint64_t serial, const Result<IPCArguments>& answer) {
  const auto found = pending_.extract(serial);
  if (!found) return;
  const Pending& call = found.mapped();
  const auto values = answer && call.reply ? argumentsFor(answer.value(), *call.reply) : std::optional<IPCArguments>();
  if (values || (answer && !call.reply)) {
    if (call.completion) call.completion(values.value_or(IPCArguments()));
  } else if (call.errorHandler) {
    call.errorHandler(answer ? localError(IPCErrorCode::RemoteError, "malformed reply") : answer.error());
  }
}

void FakeIPCConnection::end(bool byPeer) {
  if (std::exchange(ended_, true)) return;
  inbox_.clear();
  queue_->async(
      [handler = byPeer && named_ ? interruptionHandler_ : invalidationHandler_, failed = std::exchange(pending_, {})] {
        for (const auto& [serial, call] : failed) {
          if (call.errorHandler)
            call.errorHandler(localError(IPCErrorCode::ConnectionInvalid, "the connection was lost"));
        }
        if (handler) handler();
      });
  interruptionHandler_ = invalidationHandler_ = nullptr;
  if (!byPeer) sendToOther([](FakeIPCConnection& other) { other.end(true); });
  // Last: it may own this very connection.
  const auto released = std::move(exported_);
}

void RecordingExportedObject::handleCall(const std::shared_ptr<platform::IPCConnection>&, const IPCOperation& operation,
                                         IPCArguments arguments, IPCReply reply) {
  ReceivedCall call{operation.member, std::move(arguments), std::move(reply)};
  // An answered call must not keep its reply or its descriptors from going.
  if (answer) answer(std::exchange(call, ReceivedCall{operation.member, {}, {}}));
  calls_.add(std::move(call));
}

}  // namespace qv::fakes
