#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/sdbus/BusDriver.h"
#include "platform/sdbus/BusErrors.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {
namespace {

/// A broken connection shows in the next step of sd-bus, once what the peer sent has been read.
bool isBroken(int error) { return error == -ENOTCONN || error == -EPIPE || error == -ECONNRESET; }

}  // namespace

/// Before it is ready, sending descriptors would make sd-bus wait for the peer.
bool BusDriver::mayFlush() const {
  uint64_t queued = 0;
  return bus_ && sd_bus_is_ready(bus_.get()) > 0 && (sd_bus_get_n_queued_write(bus_.get(), &queued) < 0 || queued == 0);
}

/// Gives sd-bus one message after the other for as long as the kernel takes them at once.
void BusDriver::flush() {
  const auto self = shared_from_this();
  isFlushScheduled_ = false;
  int budget = kMessagesPerTurn;
  while (mayFlush()) {
    if (outbox_.settle()) noteProgress();
    if (budget-- == 0) {
      flushSoon();
      break;
    }
    if (mustHearPeerFirst()) break;
    auto message = outbox_.next();
    if (!message) {
      if (drain_ && drain_->marker == 0) sendDrainMarker();
      break;
    }
    send(std::move(*message));
  }
  if (bus_) updateWatch();
}

/// A peer that is still authenticating (we have finished first) takes descriptors for an attack, and
/// gives up. So the first of them waits until the peer has said anything; a ping makes it.
bool BusDriver::mustHearPeerFirst() {
  if (peer_ == Peer::Heard || side_ == Side::Client || !outbox_.nextHasDescriptors()) return false;
  uint64_t cookie = 0;
  if (std::exchange(peer_, Peer::Probed) == Peer::Unheard && sendPing(cookie) < 0) {
    QV_LOG_ERROR(logs::kIPC, "cannot probe the peer");
  }
  return true;
}

void BusDriver::send(OutgoingMessage message) {
  const int r = std::visit([this](auto& each) { return sendMessage(each); }, message);
  if (r < 0) return sendingFailed(message, r);
  everSent_ = true;
}

void BusDriver::sendingFailed(const OutgoingMessage& message, int error) {
  const auto* call = std::get_if<OutgoingCall>(&message);
  if (!call) {
    if (!isBroken(error)) QV_LOG_ERROR(logs::kIPC, "cannot send an answer: %s", std::strerror(-error));
    return;
  }
  endCall(call->id, isBroken(error) ? ipcError(IPCErrorCode::ConnectionInvalid, "the peer is gone")
                                    : ipcError(IPCErrorCode::InvalidArguments,
                                               call->operation->member + ": " + std::strerror(-error)));
}

int BusDriver::sendMessage(OutgoingCall& call) {
  sd_bus_message* created = nullptr;
  int r = sd_bus_message_new_method_call(bus_.get(), &created, nullptr, kObjectPath, call.table->name().c_str(),
                                         call.operation->member.c_str());
  if (r < 0) return r;
  const MessageHandle message(created);
  if ((r = encodeArguments(created, call.operation->arguments, call.arguments)) < 0) return r;
  if (!call.expectsReply && (r = sd_bus_message_set_expect_reply(created, false)) < 0) return r;
  uint64_t cookie = 0;
  if ((r = sd_bus_send(bus_.get(), created, call.expectsReply ? &cookie : nullptr)) < 0) return r;
  if (call.expectsReply) {
    sentCalls_[cookie] = {call.id, call.table, call.operation};
  } else if (const auto client = client_.lock()) {
    client->driverSentCall(call.id);
  }
  return 0;
}

std::optional<BusDriver::ReceivedCall> BusDriver::takeReceived(uint64_t token) {
  const auto it = received_.find(token);
  if (it == received_.end()) return std::nullopt;
  ReceivedCall call = std::move(it->second);
  received_.erase(it);
  return call;
}

int BusDriver::sendMessage(OutgoingError& error) {
  const auto call = takeReceived(error.token);
  if (!call) return 0;
  return sd_bus_reply_method_errorf(call->message.get(), error.name.c_str(), "%s", error.message.c_str());
}

int BusDriver::sendMessage(OutgoingAnswer& answer) {
  const auto call = takeReceived(answer.token);
  if (!call) return 0;
  sd_bus_message* created = nullptr;
  int r = sd_bus_message_new_method_return(call->message.get(), &created);
  if (r < 0) return r;
  const MessageHandle message(created);
  r = encodeArguments(created, call->operation->reply.value_or(std::vector<std::string>{}), answer.values);
  if (r >= 0) r = sd_bus_send(bus_.get(), created, nullptr);
  if (r >= 0 || isBroken(r)) return r;
  QV_LOG_ERROR(logs::kIPC, "%s: the answer cannot be sent: %s", call->operation->member.c_str(), std::strerror(-r));
  return sd_bus_reply_method_errorf(call->message.get(), kInvalidReplyError, "%s", std::strerror(-r));
}

int BusDriver::sendPing(uint64_t& cookie) {
  sd_bus_message* created = nullptr;
  const int r =
      sd_bus_message_new_method_call(bus_.get(), &created, nullptr, kObjectPath, "org.freedesktop.DBus.Peer", "Ping");
  if (r < 0) return r;
  const MessageHandle message(created);
  return sd_bus_send(bus_.get(), created, &cookie);
}

/// The peer's answer to this shows that it has read all that was sent before.
void BusDriver::sendDrainMarker() {
  if (!everSent_ || sendPing(drain_->marker) < 0) close();
}

}  // namespace qv::platform::sdbus
