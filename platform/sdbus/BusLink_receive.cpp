#include <cerrno>
#include <cstring>

#include "platform/sdbus/BusErrors.h"
#include "platform/sdbus/BusLink.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {
namespace {

/// The right to answer one received call. A call that nobody answers fails when this goes.
///
/// Threading: thread-safe.
class CallAnswer final : public IPCReply::Sink {
 public:
  CallAnswer(std::weak_ptr<BusLink> link, uint64_t token) : link_(std::move(link)), token_(token) {}
  ~CallAnswer() override { CallAnswer::fail(kNoReplyError, "the call was not answered"); }

  void succeed(IPCArguments values) override {
    if (answered_.exchange(true)) return;
    if (const auto link = link_.lock()) link->answer(token_, std::move(values));
  }
  void fail(std::string errorName, std::string message) override {
    if (answered_.exchange(true)) return;
    if (sd_bus_interface_name_is_valid(errorName.c_str()) <= 0) errorName = SD_BUS_ERROR_FAILED;
    if (const auto link = link_.lock()) link->answerError(token_, std::move(errorName), std::move(message));
  }

 private:
  const std::weak_ptr<BusLink> link_;
  const uint64_t token_;
  std::atomic<bool> answered_{false};
};

Error errorFromReply(const sd_bus_error& reply) {
  const std::string name = reply.name ? reply.name : "";
  IPCErrorCode code = IPCErrorCode::RemoteError;
  if (name == SD_BUS_ERROR_UNKNOWN_METHOD || name == SD_BUS_ERROR_UNKNOWN_INTERFACE ||
      name == SD_BUS_ERROR_UNKNOWN_OBJECT) {
    code = IPCErrorCode::UnknownOperation;
  } else if (name == SD_BUS_ERROR_INVALID_ARGS) {
    code = IPCErrorCode::InvalidArguments;
  } else if (name == kNoReplyError || name == SD_BUS_ERROR_NO_REPLY) {
    code = IPCErrorCode::NoReply;
  }
  Error error = ipcError(code, reply.message ? reply.message : name);
  error.userInfo[kIPCRemoteErrorNameKey] = Value(name);
  return error;
}

/// Whether the peer sent what no correct peer sends, as opposed to what we do not take.
bool isGarbage(int decodingError) {
  return decodingError == -EBADMSG || decodingError == -ENXIO || decodingError == -EBUSY;
}

}  // namespace

int BusLink::onMethod(sd_bus_message* message, void* link, sd_bus_error* error) {
  return static_cast<BusLink*>(link)->receiveCall(message, error);
}

int BusLink::onMessage(sd_bus_message* message, void* link, sd_bus_error*) {
  static_cast<BusLink*>(link)->heardPeer_ = true;
  uint8_t type = 0;
  if (sd_bus_message_get_type(message, &type) < 0) return 0;
  if (type != SD_BUS_MESSAGE_METHOD_RETURN && type != SD_BUS_MESSAGE_METHOD_ERROR) return 0;
  static_cast<BusLink*>(link)->receiveReply(message);
  return 1;
}

int BusLink::receiveCall(sd_bus_message* message, sd_bus_error* error) {
  const char* member = sd_bus_message_get_member(message);
  const IPCOperation* operation = member ? exported_->operation(member) : nullptr;
  if (!operation) return sd_bus_error_set(error, SD_BUS_ERROR_UNKNOWN_METHOD, "unknown operation");
  if (received_.size() >= context_->options.maximumUnansweredCalls) {
    return sd_bus_error_set(error, SD_BUS_ERROR_LIMITS_EXCEEDED, "too many unanswered calls");
  }
  IPCArguments arguments;
  const int r = decodeArguments(message, operation->arguments, arguments);
  if (r < 0 && isGarbage(r)) receiveFailure_ = r;
  if (r == -EINVAL) return sd_bus_error_set(error, SD_BUS_ERROR_INVALID_ARGS, "a type that is not understood");
  if (r < 0) return sd_bus_error_set(error, SD_BUS_ERROR_LIMITS_EXCEEDED, std::strerror(-r));
  uint64_t token = 0;
  if (sd_bus_message_get_expect_reply(message) > 0) {
    token = ++lastToken_;
    received_.emplace(token, ReceivedCall{MessageHandle(sd_bus_message_ref(message)), operation});
  }
  deliverCall(*operation, std::move(arguments), token);
  return 1;
}

void BusLink::deliverCall(const IPCOperation& operation, IPCArguments arguments, uint64_t token) {
  const size_t bytes = costOf(arguments).bytes;
  std::shared_ptr<CallAnswer> answer;
  if (token != 0) answer = std::make_shared<CallAnswer>(weak_from_this(), token);
  std::lock_guard lock(mutex_);
  if (ended_) return;
  // The table keeps the operation; the arguments go when the handler has run, or cannot run.
  deliver(
      [owner = owner_, table = exported_, &operation, arguments = std::move(arguments),
       answer = std::move(answer)]() mutable {
        const auto strong = owner.lock();
        if (!strong) return;
        const bool handsReply = operation.reply && answer;
        strong->linkReceivedCall(operation, std::move(arguments), handsReply ? IPCReply(answer) : IPCReply());
        // Whoever asks for an answer to a one-way operation learns that it was handled.
        if (answer && !operation.reply) answer->succeed({});
        answer.reset();
      },
      bytes);
}

/// Queues work that a message caused, and counts it until it has run. Under the lock.
void BusLink::deliver(std::function<void()> work, size_t bytes) {
  unhandledMessages_ += 1;
  unhandledBytes_ += bytes;
  queue_->async([self = shared_from_this(), work = std::move(work), bytes]() mutable {
    work();
    work = nullptr;
    self->handled(bytes);
  });
}

void BusLink::handled(size_t bytes) {
  unhandledMessages_ -= 1;
  unhandledBytes_ -= bytes;
  if (!readingPaused_ || hasTooMuchUnhandled()) return;
  context_->io.post([self = shared_from_this()] {
    if (self->bus_) self->process(false, false);
  });
}

bool BusLink::hasTooMuchUnhandled() const {
  return unhandledMessages_ > context_->options.maximumUnhandledMessages ||
         unhandledBytes_ > context_->options.maximumUnhandledBytes;
}

void BusLink::receiveReply(sd_bus_message* message) {
  uint64_t cookie = 0;
  if (sd_bus_message_get_reply_cookie(message, &cookie) < 0) return;
  if (drainCookie_ != 0 && cookie == drainCookie_) {
    receiveFailure_ = -ECONNRESET;  // all is read; ends the connection after this step
    return;
  }
  const auto it = callsByCookie_.find(cookie);
  if (it == callsByCookie_.end()) return;
  const uint64_t id = it->second.id;
  const IPCOperation& operation = *it->second.operation;
  callsByCookie_.erase(it);
  if (const sd_bus_error* failure = sd_bus_message_get_error(message)) return endCall(id, errorFromReply(*failure));
  IPCArguments values;
  int r = 0;
  if (!sd_bus_message_has_signature(message, InterfaceTable::replySignature(operation).c_str())) r = -EINVAL;
  if (r == 0 && operation.reply) r = decodeArguments(message, *operation.reply, values);
  if (r < 0 && isGarbage(r)) receiveFailure_ = r;
  if (r < 0) return endCall(id, ipcError(IPCErrorCode::RemoteError, "a malformed reply"));
  endCall(id, std::move(values));
}

/// The one end of a call that the peer answered; a call that ended with its link stays ended.
void BusLink::endCall(uint64_t id, std::variant<IPCArguments, Error> outcome) {
  std::lock_guard lock(mutex_);
  auto call = takeCall(id);
  if (!call) return;
  if (auto* values = std::get_if<IPCArguments>(&outcome)) {
    if (!call->completion) return;
    const size_t bytes = costOf(*values).bytes;
    deliver([completion = std::move(call->completion), arguments = std::move(*values)] { completion(arguments); },
            bytes);
  } else if (call->errorHandler) {
    deliver([handler = std::move(call->errorHandler), error = std::get<Error>(std::move(outcome))] { handler(error); },
            0);
  }
}

}  // namespace qv::platform::sdbus
