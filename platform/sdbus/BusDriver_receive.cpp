#include <cerrno>
#include <cstring>

#include "platform/sdbus/BusDriver.h"
#include "platform/sdbus/BusErrors.h"
#include "platform/sdbus/IPCContext.h"

namespace qv::platform::sdbus {
namespace {

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

int BusDriver::onMethod(sd_bus_message* message, void* exported, sd_bus_error* error) {
  const Exported& of = *static_cast<Exported*>(exported);
  return of.driver->receiveCall(of, message, error);
}

int BusDriver::onMessage(sd_bus_message* message, void* driver, sd_bus_error*) {
  static_cast<BusDriver*>(driver)->peer_ = Peer::Heard;  // a message came, so it has finished authenticating
  uint8_t type = 0;
  if (sd_bus_message_get_type(message, &type) < 0) return 0;
  if (type != SD_BUS_MESSAGE_METHOD_RETURN && type != SD_BUS_MESSAGE_METHOD_ERROR) return 0;
  static_cast<BusDriver*>(driver)->receiveReply(message);
  return 1;
}

int BusDriver::receiveCall(const Exported& exported, sd_bus_message* message, sd_bus_error* error) {
  const char* member = sd_bus_message_get_member(message);
  const IPCOperation* operation = member ? exported.table->operation(member) : nullptr;
  if (!operation) return sd_bus_error_set(error, SD_BUS_ERROR_UNKNOWN_METHOD, "unknown operation");
  if (received_.size() >= context_->options.maximumUnansweredCalls) {
    return sd_bus_error_set(error, SD_BUS_ERROR_LIMITS_EXCEEDED, "too many unanswered calls");
  }
  IPCArguments arguments;
  const int r = decodeArguments(message, operation->arguments, arguments);
  if (isGarbage(r)) receiveFailure_ = r;
  if (r == -EINVAL) return sd_bus_error_set(error, SD_BUS_ERROR_INVALID_ARGS, "a type that is not understood");
  if (r < 0) return sd_bus_error_set(error, SD_BUS_ERROR_LIMITS_EXCEEDED, std::strerror(-r));
  uint64_t token = 0;
  if (sd_bus_message_get_expect_reply(message) > 0) {
    token = ++lastToken_;
    received_.emplace(token, ReceivedCall{MessageHandle(sd_bus_message_ref(message)), operation});
  }
  if (const auto client = client_.lock())
    client->driverReceivedCall(exported.table, *operation, std::move(arguments), token);
  return 1;
}

void BusDriver::receiveReply(sd_bus_message* message) {
  uint64_t cookie = 0;
  if (sd_bus_message_get_reply_cookie(message, &cookie) < 0) return;
  noteProgress();
  if (drain_ && drain_->marker != 0 && cookie == drain_->marker) {
    receiveFailure_ = -ECONNRESET;  // all is read
    return;
  }
  const auto it = sentCalls_.find(cookie);
  if (it == sentCalls_.end()) return;
  const SentCall call = std::move(it->second);
  sentCalls_.erase(it);
  const IPCOperation& operation = *call.operation;
  if (const sd_bus_error* failure = sd_bus_message_get_error(message))
    return endCall(call.id, errorFromReply(*failure));
  IPCArguments values;
  int r = 0;
  if (!sd_bus_message_has_signature(message, InterfaceTable::replySignature(operation).c_str())) r = -EINVAL;
  if (r == 0 && operation.reply) r = decodeArguments(message, *operation.reply, values);
  if (isGarbage(r)) receiveFailure_ = r;
  if (r < 0) return endCall(call.id, ipcError(IPCErrorCode::RemoteError, "a malformed reply"));
  endCall(call.id, std::move(values));
}

void BusDriver::endCall(uint64_t id, std::variant<IPCArguments, Error> outcome) {
  if (const auto client = client_.lock()) client->driverEndedCall(id, std::move(outcome));
}

}  // namespace qv::platform::sdbus
