#include <sys/mman.h>
#include <sys/stat.h>

#include <cerrno>

#include "tests/fakes/FakeIPC.h"

namespace qv::fakes {

using platform::Error;
using platform::IPCConnection;
using platform::IPCPeer;
using platform::ListenerEndpoint;
using platform::Result;
using platform::SerialQueue;

namespace {

/// What tells one anonymous listener's endpoint from another's, however often it was duplicated.
std::string endpointKey(int fd) {
  struct stat status {};
  if (::fstat(fd, &status) != 0) return {};
  return "endpoint " + std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

}  // namespace

class FakeIPCListener final : public platform::IPCListener {
 public:
  FakeIPCListener(FakeIPCService& service, std::string key, ListenerEndpoint endpoint)
      : service_(service), key_(std::move(key)), endpoint_(std::move(endpoint)) {
    state_->listener = this;
  }
  ~FakeIPCListener() override { FakeIPCListener::invalidate(); }

  void setDelegate(platform::IPCListenerDelegate* delegate, SerialQueue& queue) override {
    std::lock_guard lock(state_->mutex);
    state_->delegate = delegate;
    state_->queue = &queue;
  }
  std::optional<Error> resume() override {
    std::lock_guard lock(service_.mutex_);
    if (!service_.listeners_.emplace(key_, this).second) return Error::posix(EADDRINUSE, key_);
    return std::nullopt;
  }
  void invalidate() override {
    {
      std::lock_guard lock(service_.mutex_);
      if (const auto it = service_.listeners_.find(key_); it != service_.listeners_.end() && it->second == this)
        service_.listeners_.erase(it);
    }
    std::lock_guard lock(state_->mutex);
    state_->delegate = nullptr;
    state_->listener = nullptr;
  }
  ListenerEndpoint endpoint() const override { return endpoint_; }

  void accept(std::shared_ptr<IPCConnection> connection) {
    std::unique_lock lock(state_->mutex);
    SerialQueue* queue = state_->queue;
    lock.unlock();
    if (!queue) return;
    queue->async([state = state_, connection = std::move(connection)] {
      std::unique_lock stateLock(state->mutex);
      platform::IPCListenerDelegate* delegate = state->delegate;
      FakeIPCListener* listener = state->listener;
      stateLock.unlock();
      if (!delegate || !delegate->listenerShouldAcceptNewConnection(*listener, connection)) connection->invalidate();
    });
  }

 private:
  struct State {
    std::mutex mutex;
    platform::IPCListenerDelegate* delegate = nullptr;
    SerialQueue* queue = nullptr;
    FakeIPCListener* listener = nullptr;
  };

  FakeIPCService& service_;
  const std::string key_;
  const ListenerEndpoint endpoint_;
  const std::shared_ptr<State> state_ = std::make_shared<State>();
};

FakeIPCService::FakeIPCService(platform::Executor& executor) : executor_(executor) {}
FakeIPCService::~FakeIPCService() = default;

std::unique_ptr<platform::IPCListener> FakeIPCService::createListener(const std::string& serviceName) {
  return std::make_unique<FakeIPCListener>(*this, serviceName, ListenerEndpoint());
}

std::unique_ptr<platform::IPCListener> FakeIPCService::createAnonymousListener() {
  platform::FileDescriptor rendezvous(::memfd_create("fake endpoint", MFD_CLOEXEC));
  const std::string key = endpointKey(rendezvous.get());
  return std::make_unique<FakeIPCListener>(*this, key,
                                           ListenerEndpoint(platform::shareFileDescriptor(std::move(rendezvous))));
}

Result<std::shared_ptr<IPCConnection>> FakeIPCService::connect(const std::string& serviceName) {
  return connectTo(serviceName, true);
}

Result<std::shared_ptr<IPCConnection>> FakeIPCService::connect(const ListenerEndpoint& endpoint) {
  return connectTo(endpoint.isValid() ? endpointKey(endpoint.rendezvous()->get()) : std::string(), false);
}

Result<std::shared_ptr<IPCConnection>> FakeIPCService::connectTo(const std::string& key, bool named) {
  std::lock_guard lock(mutex_);
  ++connectCount_;
  const auto it = listeners_.find(key);
  if (it == listeners_.end()) return Error::posix(ECONNREFUSED, key);
  auto [client, server] = FakeIPCConnection::makePair(executor_, {}, clientPeer_, named);
  client->setChecksMessages(checksMessages_);
  server->setChecksMessages(checksMessages_);
  it->second->accept(std::move(server));
  return std::shared_ptr<IPCConnection>(std::move(client));
}

void FakeIPCService::setClientPeer(IPCPeer peer) {
  std::lock_guard lock(mutex_);
  clientPeer_ = std::move(peer);
}

void FakeIPCService::setChecksMessages(bool checks) {
  std::lock_guard lock(mutex_);
  checksMessages_ = checks;
}

size_t FakeIPCService::connectCount() const {
  std::lock_guard lock(mutex_);
  return connectCount_;
}

}  // namespace qv::fakes
