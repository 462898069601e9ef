#include "platform/sdbus/BusLink.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>

#include "platform/sdbus/BusErrors.h"
#include "platform/sdbus/BusObject.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {
namespace {

constexpr int kMessagesPerTurn = 64;  // then others have theirs
/// Answers that sd-bus gives by itself (errors, introspection) wait in its own queue: a peer that
/// asks without reading is not read either beyond this many.
constexpr uint64_t kMaximumBusQueue = 64;

/// How much the kernel may hold for a peer that does not read; it counts twice this, with its own
/// overhead. sd-bus asks for 8 MiB and gets them as root: seconds of sound on top of our own bound.
constexpr int kSocketBufferBytes = 256 << 10;

uint64_t queuedInBus(sd_bus* bus) {
  uint64_t count = 0;
  return sd_bus_get_n_queued_write(bus, &count) < 0 ? 0 : count;
}

}  // namespace

BusLink::BusLink(std::shared_ptr<IPCContext> context, FileDescriptor socket, Role role)
    : context_(std::move(context)),
      role_(role),
      queue_(std::make_shared<SerialQueue>("com.tarnwick.quorveld.connection")),
      socket_(std::move(socket)) {}

BusLink::~BusLink() = default;

void BusLink::setExportedInterface(const IPCInterface& interface) {
  exported_ = InterfaceTable::shared(interface);
  exportedMethods_ = exported_->methods(&BusLink::onMethod);
}

void BusLink::resume() { postToSelf(&BusLink::open); }

void BusLink::open() {
  // Opened even when it has been invalidated since: what was sent before that still goes out.
  if (bus_ || !socket_.isValid()) return;
  context_->links.insert(shared_from_this());
  const int r = prepareBus();
  if (r < 0) return lost(r);
  process(false, false);
}

int BusLink::prepareBus() {
  sd_bus* bus = nullptr;
  int r = sd_bus_new(&bus);
  if (r < 0) return r;
  bus_.reset(bus);
  fd_ = socket_.release();
  if ((r = sd_bus_set_fd(bus, fd_, fd_)) < 0) {
    socket_.reset(fd_);
    return r;
  }
  if ((r = sd_bus_negotiate_fds(bus, 1)) < 0) return r;
  if (role_ == Role::Accepted) {
    sd_id128_t id{};
    if ((r = sd_id128_randomize(&id)) < 0 || (r = sd_bus_set_server(bus, 1, id)) < 0) return r;
    if ((r = addBusObject(bus)) < 0) return r;
  }
  if ((r = sd_bus_add_filter(bus, nullptr, &BusLink::onMessage, this)) < 0) return r;
  if (exported_) {
    r = sd_bus_add_object_vtable(bus, nullptr, kObjectPath, exported_->name().c_str(), exportedMethods_.data(), this);
    if (r < 0) return r;
  }
  if ((r = sd_bus_start(bus)) < 0) return r;
  ::setsockopt(fd_, SOL_SOCKET, SO_SNDBUF, &kSocketBufferBytes, sizeof kSocketBufferBytes);
  watchedEvents_ = EPOLLIN;
  watch_ = context_->io.watch(fd_, watchedEvents_, [this](uint32_t events) { onEvents(events); });
  return 0;
}

void BusLink::onEvents(uint32_t events) { process(events & (EPOLLHUP | EPOLLERR), events & EPOLLOUT); }

void BusLink::process(bool hangUp, bool writable) {
  const auto self = shared_from_this();
  int budget = kMessagesPerTurn;
  int r = 1;
  while (bus_ && r > 0 && budget-- > 0) {
    // What a peer sent before it went is at most a socket buffer: it is read even while paused.
    if (pauseReading(hangUp) && !writable) break;
    // sd-bus writes before it reads, one step a call: with room to write, nothing is read.
    writable = false;
    r = sd_bus_process(bus_.get(), nullptr);
    if (r >= 0) r = receiveFailure_ < 0 ? receiveFailure_ : r;
  }
  if (!bus_) return;
  if (r < 0) return lost(r);
  flush();
  if (bus_ && r > 0 && !readingPaused_) {
    context_->io.post([self] {
      if (self->bus_) self->process(false, false);
    });
  }
}

bool BusLink::pauseReading(bool hangUp) {
  // Said before it is looked at: then the last handler to finish sees one or the other.
  readingPaused_ = true;
  readingPaused_ = !hangUp && (hasTooMuchUnhandled() || queuedInBus(bus_.get()) > kMaximumBusQueue);
  return readingPaused_;
}

/// Gives sd-bus one message after the other for as long as the kernel takes them at once.
void BusLink::flush() {
  const auto self = shared_from_this();
  {
    std::lock_guard lock(mutex_);
    flushScheduled_ = false;
  }
  if (!bus_) return;
  int budget = kMessagesPerTurn;
  // Before it is ready, sending descriptors would make sd-bus wait for the peer.
  while (bus_ && sd_bus_is_ready(bus_.get()) > 0 && queuedInBus(bus_.get()) == 0) {
    settleSent();
    if (budget-- == 0) {
      std::lock_guard lock(mutex_);
      scheduleFlush();
      break;
    }
    if (mustHearPeerFirst()) {
      if (probeCookie_ == 0 && sendPing(probeCookie_) < 0) QV_LOG_ERROR(logs::kIPC, "cannot probe the peer");
      break;
    }
    auto message = nextOutgoing();
    if (!message) {
      if (draining_ && drainCookie_ == 0) sendDrainMarker();
      break;
    }
    send(std::move(*message));
  }
  if (bus_) updateWatch();
}

void BusLink::settleSent() {
  if (sentBytes_ == 0) return;
  std::lock_guard lock(mutex_);
  queuedBytes_ -= std::exchange(sentBytes_, 0);
  queuedMediaBytes_ -= std::exchange(sentMediaBytes_, 0);
}

std::optional<BusLink::Outgoing> BusLink::nextOutgoing() {
  std::lock_guard lock(mutex_);
  if (outbox_.empty()) return std::nullopt;
  Outgoing message = std::move(outbox_.front());
  outbox_.pop_front();
  sentBytes_ += message.bytes;
  if (message.operation && message.operation->isMedia) sentMediaBytes_ += message.bytes;
  return message;
}

void BusLink::send(Outgoing message) {
  const int r = message.kind == Outgoing::Kind::Call ? sendCall(message) : sendAnswer(message);
  if (r >= 0) {
    everSent_ = true;
    return;
  }
  // A broken connection shows in the next step of sd-bus, once what the peer sent has been read.
  const bool isBroken = r == -ENOTCONN || r == -EPIPE || r == -ECONNRESET;
  if (message.kind != Outgoing::Kind::Call) {
    if (!isBroken) QV_LOG_ERROR(logs::kIPC, "cannot send an answer: %s", std::strerror(-r));
    return;
  }
  std::lock_guard lock(mutex_);
  auto call = takeCall(message.token);
  if (!call) return;
  failOnQueue(std::move(call->errorHandler), isBroken ? ipcError(IPCErrorCode::ConnectionInvalid, "the peer is gone")
                                                      : ipcError(IPCErrorCode::InvalidArguments,
                                                                 message.operation->member + ": " + std::strerror(-r)));
}

int BusLink::sendCall(Outgoing& message) {
  std::string interface;
  {
    std::lock_guard lock(mutex_);
    interface = remotes_.back()->name();
  }
  sd_bus_message* call = nullptr;
  int r = sd_bus_message_new_method_call(bus_.get(), &call, nullptr, kObjectPath, interface.c_str(),
                                         message.operation->member.c_str());
  if (r < 0) return r;
  const MessageHandle handle(call);
  if ((r = encodeArguments(call, message.operation->arguments, message.values)) < 0) return r;
  if (!message.expectsReply) {
    if ((r = sd_bus_message_set_expect_reply(call, 0)) < 0 || (r = sd_bus_send(bus_.get(), call, nullptr)) < 0)
      return r;
    std::lock_guard lock(mutex_);
    takeCall(message.token);
    return 0;
  }
  uint64_t cookie = 0;
  if ((r = sd_bus_send(bus_.get(), call, &cookie)) < 0) return r;
  callsByCookie_[cookie] = {message.token, message.operation};
  return 0;
}

int BusLink::sendAnswer(Outgoing& message) {
  const auto it = received_.find(message.token);
  if (it == received_.end()) return 0;
  const ReceivedCall call = std::move(it->second);
  received_.erase(it);
  sd_bus_message* answer = nullptr;
  if (message.kind == Outgoing::Kind::ErrorAnswer) {
    return sd_bus_reply_method_errorf(call.message.get(), message.errorName.c_str(), "%s",
                                      message.errorMessage.c_str());
  }
  int r = sd_bus_message_new_method_return(call.message.get(), &answer);
  if (r < 0) return r;
  const MessageHandle handle(answer);
  r = encodeArguments(answer, call.operation->reply.value_or(std::vector<std::string>{}), message.values);
  if (r >= 0) r = sd_bus_send(bus_.get(), answer, nullptr);
  if (r >= 0 || r == -ENOTCONN || r == -EPIPE || r == -ECONNRESET) return r;
  QV_LOG_ERROR(logs::kIPC, "%s: the answer cannot be sent: %s", call.operation->member.c_str(), std::strerror(-r));
  return sd_bus_reply_method_errorf(call.message.get(), kInvalidReplyError, "%s", std::strerror(-r));
}

/// A peer that is still authenticating (we have finished first) takes descriptors for an attack, and
/// gives up. So the first of them waits until the peer has said anything; a ping makes it.
bool BusLink::mustHearPeerFirst() {
  if (heardPeer_ || role_ != Role::Accepted) return false;
  std::lock_guard lock(mutex_);
  return !outbox_.empty() && outbox_.front().hasDescriptors;
}

int BusLink::sendPing(uint64_t& cookie) {
  sd_bus_message* ping = nullptr;
  const int r =
      sd_bus_message_new_method_call(bus_.get(), &ping, nullptr, kObjectPath, "org.freedesktop.DBus.Peer", "Ping");
  if (r < 0) return r;
  const MessageHandle handle(ping);
  return sd_bus_send(bus_.get(), ping, &cookie);
}

/// The peer's answer to this shows that it has read all that was sent before.
void BusLink::sendDrainMarker() {
  if (!everSent_ || sendPing(drainCookie_) < 0) close();
}

void BusLink::drain() {
  if (!bus_) return close();
  draining_ = true;
  const auto bound = std::chrono::milliseconds(context_->options.drainMilliseconds);
  drainTimer_ = context_->io.after(bound, [weak = weak_from_this()] {
    if (auto self = weak.lock()) self->close();
  });
  flush();
}

void BusLink::updateWatch() {
  const int wanted = sd_bus_get_events(bus_.get());
  if (wanted < 0) {
    // Closed by the peer: sd-bus has a last step to do.
    context_->io.post([self = shared_from_this()] {
      if (self->bus_) self->process(true, false);
    });
    return;
  }
  uint32_t events = wanted & POLLOUT ? uint32_t{EPOLLOUT} : 0;
  if ((wanted & POLLIN) && !readingPaused_) events |= EPOLLIN;
  if (events != watchedEvents_) {
    watchedEvents_ = events;
    context_->io.modify(watch_, fd_, events);
  }
  watchTimeout();
}

/// sd-bus bounds the time of the authentication, and has steps to do without any event.
void BusLink::watchTimeout() {
  if (timer_ != 0) context_->io.cancel(std::exchange(timer_, 0));
  uint64_t due = UINT64_MAX;
  if (sd_bus_get_timeout(bus_.get(), &due) < 0 || due == UINT64_MAX || readingPaused_) return;
  const auto now = std::chrono::steady_clock::now().time_since_epoch();
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(std::chrono::microseconds(due) - now);
  timer_ = context_->io.after(std::max(left, std::chrono::milliseconds(0)), [this] {
    timer_ = 0;
    process(false, false);
  });
}

void BusLink::lost(int error) {
  if (error != -ECONNRESET && error != -EPIPE && error != -ENOTCONN) {
    QV_LOG_ERROR(logs::kIPC, "connection dropped: %s", std::strerror(-error));
  }
  {
    std::lock_guard lock(mutex_);
    endLocked(End::Lost);
  }
  close();
}

void BusLink::close() {
  const auto self = shared_from_this();
  if (timer_ != 0) context_->io.cancel(std::exchange(timer_, 0));
  if (drainTimer_ != 0) context_->io.cancel(std::exchange(drainTimer_, 0));
  // sd-bus closes a broken connection's descriptor by itself. Then the number may be another thread's by now.
  const int open = bus_ ? sd_bus_get_fd(bus_.get()) : -1;
  if (watch_ != 0) context_->io.unwatch(std::exchange(watch_, 0), open);
  received_.clear();
  callsByCookie_.clear();
  bus_.reset();
  socket_.reset();
  admission_.reset();
  context_->links.erase(self);
  {
    std::lock_guard lock(mutex_);
    outbox_.clear();
  }
  context_->tellWhenIdle();
}

}  // namespace qv::platform::sdbus
