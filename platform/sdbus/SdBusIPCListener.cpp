#include "platform/sdbus/SdBusIPCListener.h"

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/sdbus/SdBusIPCConnection.h"
#include "platform/sdbus/Sockets.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {
namespace {
FileDescriptor openSpare() { return FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC)); }
}  // namespace

void ListenerState::start(FileDescriptor openedSocket, bool rendezvous) {
  auto shared = std::make_shared<FileDescriptor>(std::move(openedSocket));
  context->io.post([self = shared_from_this(), shared, rendezvous] {
    self->socket_ = std::move(*shared);
    self->isRendezvous_ = rendezvous;
    self->spare_ = openSpare();
    self->watch_ = self->context->io.watch(self->socket_.get(), EPOLLIN, [weak = self->weak_from_this()](uint32_t) {
      if (const auto state = weak.lock()) state->acceptAll();
    });
    self->context->listeners.insert(self);
  });
}

void ListenerState::stop() {
  context->io.post([self = shared_from_this()] {
    self->watch_.end();
    self->socket_.reset();
    self->spare_.reset();
    self->context->listeners.erase(self);
  });
}

FileDescriptor ListenerState::acceptNext(bool& isEmpty) {
  if (isRendezvous_) {
    auto received = acceptFrom(socket_.get());
    isEmpty = !received;
    return received ? std::move(*received) : FileDescriptor();
  }
  FileDescriptor accepted(::accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
  if (accepted.isValid()) {
    if (!context->options.trustsPeers) askForSenders(accepted.get());
    return accepted;
  }
  const bool isOutOfDescriptors = errno == EMFILE || errno == ENFILE;
  isEmpty = !isOutOfDescriptors || !refuseOne();
  return {};
}

/// Without this a full descriptor table would wake the thread without end.
bool ListenerState::refuseOne() {
  spare_.reset();
  FileDescriptor refused(::accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC));
  const bool isRefused = refused.isValid();
  if (isRefused) context->refusals.note(userOf(refused.get()), "refused: out of descriptors");
  refused.reset();
  spare_ = openSpare();
  return isRefused;
}

void ListenerState::acceptAll() {
  constexpr int kConnectionsPerTurn = 64;
  bool isEmpty = false;
  for (int i = 0; i < kConnectionsPerTurn && !isEmpty; ++i) {
    FileDescriptor accepted = acceptNext(isEmpty);
    if (accepted.isValid()) acceptOne(std::move(accepted));
  }
}

std::optional<PeerGuard> ListenerState::admit(uid_t user) {
  const auto now = UserQuota::Time::clock::now();
  auto share = QuotaShare::take(context->quotas.of(user, now), QuotaShare::Kind::Connection, now);
  if (!share) return std::nullopt;
  return PeerGuard{std::move(share), std::nullopt};
}

void ListenerState::acceptOne(FileDescriptor connected) {
  const uid_t user = userOf(connected.get());
  if (*connections_ >= context->options.maximumConnections) {
    return context->refusals.note(user, "refused: too many connections");
  }
  std::optional<PeerGuard> guard;
  if (!context->options.trustsPeers) {
    guard = admit(user);
    if (!guard) return context->refusals.note(user, "refused: too many connections of this user");
  }
  ++*connections_;
  IPCPeer peer = peerOf(connected.get());
  if (guard && !isRendezvous_) guard->sender = WireSender{peer.processIdentifier, peer.userIdentifier};
  if (context->resolver) context->resolver(peer);
  auto link = std::make_shared<BusLink>(context, std::move(connected), BusLink::Role::Accepted);
  if (guard) link->setGuard(std::move(*guard));
  link->setAdmission(std::shared_ptr<void>(nullptr, [connections = connections_](void*) { --*connections; }));
  auto connection = SdBusIPCConnection::create(std::move(link), std::move(peer));
  std::lock_guard lock(mutex);
  if (!queue) return;
  queue->async([self = shared_from_this(), connection = std::move(connection)] {
    self->gate.enter([&] { self->offer(connection); });
  });
}

void ListenerState::offer(const std::shared_ptr<IPCConnection>& connection) {
  std::unique_lock lock(mutex);
  IPCListener* const offering = listener;
  IPCListenerDelegate* const asked = delegate;
  lock.unlock();
  if (!offering || !asked) return connection->invalidate();
  if (asked->listenerShouldAcceptNewConnection(*offering, connection)) return;
  connection->setInvalidationHandler(nullptr);
  connection->invalidate();
}

SdBusIPCListener::SdBusIPCListener(std::shared_ptr<IPCContext> context, std::string path)
    : path_(std::move(path)), state_(std::make_shared<ListenerState>(std::move(context), *this)) {
  if (!path_.empty()) return;
  auto ends = createRendezvous();
  if (!ends) {
    QV_LOG_ERROR(logs::kIPC, "no anonymous listener: %s", ends.error().description().c_str());
    return;
  }
  rendezvous_ = std::move(ends->first);
  endpoint_ = shareFileDescriptor(std::move(ends->second));
}

SdBusIPCListener::~SdBusIPCListener() { invalidate(); }

void SdBusIPCListener::setDelegate(IPCListenerDelegate* delegate, SerialQueue& queue) {
  {
    std::lock_guard lock(state_->mutex);
    state_->delegate = delegate;
    state_->queue = std::make_shared<SerialQueue>("com.tarnwick.quorveld.listener", queue);
  }
  state_->gate.awaitIdle();
}

std::optional<Error> SdBusIPCListener::resume() {
  std::lock_guard lock(mutex_);
  if (isOpen_) return std::nullopt;
  if (!path_.empty()) return resumeNamed();
  if (!rendezvous_.isValid()) return Error::posix(EBADF, "anonymous listener");
  state_->start(std::move(rendezvous_), true);
  isOpen_ = true;
  return std::nullopt;
}

std::optional<Error> SdBusIPCListener::resumeNamed() {
  raiseDescriptorLimit();
  FileDescriptor socket;
  if (auto activated = adoptActivatedSocket(path_)) {
    socket = std::move(*activated);
  } else {
    auto named = listenAt(path_, state_->context->options.socketGroup);
    if (!named) return named.error();
    socket = std::move(named->socket);
    lock_ = std::move(named->lock);
  }
  if (!state_->context->options.trustsPeers) askForSenders(socket.get());
  state_->start(std::move(socket), false);
  isOpen_ = true;
  return std::nullopt;
}

void SdBusIPCListener::invalidate() {
  {
    std::lock_guard lock(mutex_);
    if (isOpen_) state_->stop();
    // The name is free again when this returns.
    if (lock_.isValid()) ::unlink(path_.c_str());
    lock_.reset();
    isOpen_ = false;
    rendezvous_.reset();
    endpoint_.reset();
  }
  {
    std::lock_guard lock(state_->mutex);
    state_->delegate = nullptr;
    state_->listener = nullptr;
  }
  state_->gate.awaitIdle();
}

ListenerEndpoint SdBusIPCListener::endpoint() const {
  std::lock_guard lock(mutex_);
  return ListenerEndpoint(endpoint_);
}

}  // namespace qv::platform::sdbus
