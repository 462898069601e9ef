#include "tests/fakes/FakeIPC.h"

#include <chrono>
#include <optional>

#include "platform/base/WireForm.h"

namespace qv::fakes {

using platform::Error;
using platform::IPCArguments;
using platform::IPCConnection;
using platform::IPCExportedObject;
using platform::IPCInterface;
using platform::IPCOperation;
using platform::IPCPeer;
using platform::IPCReply;
using platform::SerialQueue;

namespace {

Error localError(platform::IPCErrorCode code, const std::string& message) {
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

}  // namespace

/// What an end is, shared with messages on their way to it.
struct FakeIPCConnection::End : std::enable_shared_from_this<End> {
  struct Pending {
    std::optional<std::vector<std::string>> reply;
    Completion completion;
    ErrorHandler errorHandler;
  };

  void enqueue(std::function<void()> work);
  void receiveCall(const std::string& interface, const std::string& member, IPCArguments arguments, uint64_t serial);
  void receiveReply(uint64_t serial, IPCArguments values);
  void receiveError(uint64_t serial, const Error& error);
  void end(bool byPeer);
  std::optional<Pending> takePending(uint64_t serial);
  void sendToOther(std::function<void(End&)> delivery);

  std::mutex mutex;
  IPCPeer peer;
  bool named = false;
  std::weak_ptr<End> other;
  std::weak_ptr<FakeIPCConnection> connection;
  std::unique_ptr<SerialQueue> queue;
  bool resumed = false, ended = false, checksMessages = true;
  std::vector<std::function<void()>> inbox;  // until `resumed`
  IPCInterface exportedInterface, remoteInterface;
  std::shared_ptr<IPCExportedObject> exportedObject;
  std::function<void()> interruptionHandler, invalidationHandler;
  uint64_t nextSerial = 1;
  std::map<uint64_t, Pending> pending;
};

namespace {

/// Sends the one answer of a call, or the error that stands for none.
class ReplySink final : public IPCReply::Sink {
 public:
  using Answer = std::function<void(std::optional<IPCArguments>, Error)>;
  explicit ReplySink(Answer answer) : answer_(std::move(answer)) {}
  ~ReplySink() override { ReplySink::fail(kNoReplyErrorName, "the call was not answered"); }

  void succeed(IPCArguments values) override {
    if (const Answer answer = take()) answer(std::move(values), {});
  }
  void fail(std::string errorName, std::string message) override {
    if (const Answer answer = take()) answer(std::nullopt, errorReply(errorName, message));
  }

 private:
  Answer take() {
    std::lock_guard lock(mutex_);
    return std::exchange(answer_, {});
  }
  std::mutex mutex_;
  Answer answer_;
};

}  // namespace

void FakeIPCConnection::End::enqueue(std::function<void()> work) {
  std::lock_guard lock(mutex);
  if (!resumed) {
    inbox.push_back(std::move(work));
  } else {
    queue->async(std::move(work));
  }
}

void FakeIPCConnection::End::sendToOther(std::function<void(End&)> delivery) {
  if (const auto end = other.lock()) end->enqueue([end, delivery = std::move(delivery)] { delivery(*end); });
}

void FakeIPCConnection::End::receiveCall(const std::string& interface, const std::string& member,
                                         IPCArguments arguments, uint64_t serial) {
  std::unique_lock lock(mutex);
  const auto handle = connection.lock();
  if (ended || !handle) return;
  const IPCOperation* operation = exportedInterface.name == interface ? exportedInterface.operation(member) : nullptr;
  const auto object = exportedObject;
  lock.unlock();
  auto answer = [self = shared_from_this(), serial](std::optional<IPCArguments> values, const Error& error) {
    self->sendToOther([serial, values = std::move(values), error](End& caller) {
      values ? caller.receiveReply(serial, *values) : caller.receiveError(serial, error);
    });
  };
  if (!operation || !object) {
    answer(std::nullopt, errorReply(kUnknownMethodErrorName, member));
    return;
  }
  IPCReply reply;
  if (operation->reply) {
    reply = IPCReply(std::make_shared<ReplySink>(answer));
  } else {
    answer(IPCArguments{}, {});
  }
  object->handleCall(handle, *operation, std::move(arguments), std::move(reply));
}

std::optional<FakeIPCConnection::End::Pending> FakeIPCConnection::End::takePending(uint64_t serial) {
  std::lock_guard lock(mutex);
  const auto it = pending.find(serial);
  if (it == pending.end()) return std::nullopt;
  Pending found = std::move(it->second);
  pending.erase(it);
  return found;
}

void FakeIPCConnection::End::receiveReply(uint64_t serial, IPCArguments values) {
  const auto call = takePending(serial);
  if (!call) return;
  if (checksMessages && call->reply) {
    auto typed = argumentsFor(values, *call->reply);
    if (!typed) {
      if (call->errorHandler) call->errorHandler(localError(platform::IPCErrorCode::RemoteError, "malformed reply"));
      return;
    }
    values = std::move(*typed);
  }
  if (call->completion) call->completion(values);
}

void FakeIPCConnection::End::receiveError(uint64_t serial, const Error& error) {
  const auto call = takePending(serial);
  if (call && call->errorHandler) call->errorHandler(error);
}

void FakeIPCConnection::End::end(bool byPeer) {
  std::function<void()> handler;
  std::map<uint64_t, Pending> failed;
  // Released after the lock: it may own this very connection.
  std::shared_ptr<IPCExportedObject> released;
  {
    std::lock_guard lock(mutex);
    if (ended) return;
    ended = true;
    handler = byPeer && named ? interruptionHandler : invalidationHandler;
    failed.swap(pending);
    interruptionHandler = nullptr;
    invalidationHandler = nullptr;
    released.swap(exportedObject);
    inbox.clear();
    queue->async([handler = std::move(handler), failed = std::move(failed)] {
      for (const auto& [serial, call] : failed) {
        if (call.errorHandler)
          call.errorHandler(localError(platform::IPCErrorCode::ConnectionInvalid, "the connection was lost"));
      }
      if (handler) handler();
    });
  }
  if (!byPeer) sendToOther([](End& peerEnd) { peerEnd.end(true); });
}

FakeIPCConnection::Pair FakeIPCConnection::makePair(platform::Executor& executor, IPCPeer firstsPeer,
                                                    IPCPeer secondsPeer, bool named) {
  auto makeEnd = [&](const char* label, IPCPeer peer) {
    auto end = std::make_shared<End>();
    end->peer = std::move(peer);
    end->queue = std::make_unique<SerialQueue>(label, executor);
    return end;
  };
  auto first = makeEnd("fake connection, connector", std::move(firstsPeer));
  auto second = makeEnd("fake connection, acceptor", std::move(secondsPeer));
  first->named = named;
  first->other = second;
  second->other = first;
  return {std::make_shared<FakeIPCConnection>(first), std::make_shared<FakeIPCConnection>(second)};
}

FakeIPCConnection::FakeIPCConnection(std::shared_ptr<End> end) : end_(std::move(end)) {}

FakeIPCConnection::~FakeIPCConnection() { end_->end(false); }

const IPCPeer& FakeIPCConnection::peer() const { return end_->peer; }

void FakeIPCConnection::setExportedInterface(const IPCInterface& interface, std::shared_ptr<IPCExportedObject> object) {
  std::lock_guard lock(end_->mutex);
  end_->exportedInterface = interface;
  end_->exportedObject = std::move(object);
}

void FakeIPCConnection::setRemoteInterface(const IPCInterface& interface) {
  std::lock_guard lock(end_->mutex);
  end_->remoteInterface = interface;
}

void FakeIPCConnection::setInterruptionHandler(std::function<void()> handler) {
  std::lock_guard lock(end_->mutex);
  end_->interruptionHandler = std::move(handler);
}

void FakeIPCConnection::setInvalidationHandler(std::function<void()> handler) {
  std::lock_guard lock(end_->mutex);
  end_->invalidationHandler = std::move(handler);
}

void FakeIPCConnection::setTargetQueue(SerialQueue& queue) {
  std::lock_guard lock(end_->mutex);
  end_->queue = std::make_unique<SerialQueue>("fake connection", queue);
}

void FakeIPCConnection::resume() {
  std::lock_guard lock(end_->mutex);
  if (end_->resumed) return;
  end_->resumed = true;
  end_->connection = weak_from_this();
  for (auto& work : std::exchange(end_->inbox, {})) end_->queue->async(std::move(work));
}

void FakeIPCConnection::invalidate() { end_->end(false); }

void FakeIPCConnection::setChecksMessages(bool checks) {
  std::lock_guard lock(end_->mutex);
  end_->checksMessages = checks;
}

bool FakeIPCConnection::isEnded() const {
  std::lock_guard lock(end_->mutex);
  return end_->ended;
}

void FakeIPCConnection::call(std::string_view member, IPCArguments arguments, Completion completion,
                             ErrorHandler errorHandler) {
  std::unique_lock lock(end_->mutex);
  auto refuse = [&](Error error) {
    if (!errorHandler) return;
    end_->queue->async([errorHandler, error = std::move(error)] { errorHandler(error); });
  };
  if (end_->ended) return refuse(localError(platform::IPCErrorCode::ConnectionInvalid, "the connection has ended"));
  const IPCOperation* operation = end_->remoteInterface.operation(member);
  if (!operation) return refuse(localError(platform::IPCErrorCode::UnknownOperation, std::string(member)));
  auto typed = end_->checksMessages ? argumentsFor(arguments, operation->arguments) : std::move(arguments);
  if (!typed) return refuse(localError(platform::IPCErrorCode::InvalidArguments, std::string(member)));
  const uint64_t serial = end_->nextSerial++;
  end_->pending[serial] = {operation->reply, std::move(completion), std::move(errorHandler)};
  const std::string interface = end_->remoteInterface.name;
  lock.unlock();
  end_->sendToOther([interface, name = std::string(member), typed = std::move(*typed), serial](End& receiver) {
    receiver.receiveCall(interface, name, typed, serial);
  });
}

void RecordingExportedObject::handleCall(const std::shared_ptr<IPCConnection>&, const IPCOperation& operation,
                                         IPCArguments arguments, IPCReply reply) {
  ReceivedCall call{operation.member, std::move(arguments), std::move(reply)};
  if (answer_) answer_(call);
  std::lock_guard lock(mutex_);
  // An answered call must not keep its reply or its descriptors from going.
  if (answer_) call.reply = {};
  calls_.push_back(std::move(call));
  condition_.notify_all();
}

RecordingExportedObject::ReceivedCall RecordingExportedObject::takeCall() {
  std::unique_lock lock(mutex_);
  if (!condition_.wait_for(lock, std::chrono::seconds(20), [this] { return !calls_.empty(); })) return {};
  ReceivedCall call = std::move(calls_.front());
  calls_.pop_front();
  return call;
}

size_t RecordingExportedObject::callCount() const {
  std::lock_guard lock(mutex_);
  return calls_.size();
}

std::vector<std::string> RecordingExportedObject::members() const {
  std::lock_guard lock(mutex_);
  std::vector<std::string> names;
  for (const auto& call : calls_) names.push_back(call.member);
  return names;
}

}  // namespace qv::fakes
