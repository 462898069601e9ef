#include <sys/mman.h>
#include <sys/stat.h>

#include <cerrno>

#include "tests/fakes/FakeIPC.h"

namespace qv::fakes {

using platform::Error;
using platform::IPCConnection;
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
      : service_(service), key_(std::move(key)), endpoint_(std::move(endpoint)) {}
  ~FakeIPCListener() override { FakeIPCListener::invalidate(); }

  void setDelegate(platform::IPCListenerDelegate* delegate, SerialQueue& queue) override {
    delegate_ = std::make_shared<platform::IPCListenerDelegate*>(delegate);
    queue_ = &queue;
  }
  std::optional<Error> resume() override {
    if (!service_.listeners_.emplace(key_, this).second) return Error::posix(EADDRINUSE, key_);
    return std::nullopt;
  }
  void invalidate() override {
    const auto it = service_.listeners_.find(key_);
    if (it != service_.listeners_.end() && it->second == this) service_.listeners_.erase(it);
    delegate_.reset();
  }
  ListenerEndpoint endpoint() const override { return endpoint_; }

  void accept(const std::shared_ptr<IPCConnection>& connection) {
    if (!queue_) return;
    queue_->async([this, weak = std::weak_ptr(delegate_), connection] {
      const auto delegate = weak.lock();
      if (!delegate || !(*delegate)->listenerShouldAcceptNewConnection(*this, connection)) connection->invalidate();
    });
  }

 private:
  FakeIPCService& service_;
  const std::string key_;
  const ListenerEndpoint endpoint_;
  std::shared_ptr<platform::IPCListenerDelegate*> delegate_;  ///< as long as it is listened
  SerialQueue* queue_ = nullptr;
};

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
  const auto it = listeners_.find(key);
  if (it == listeners_.end()) return Error::posix(ECONNREFUSED, key);
  const auto [client, server] = FakeIPCConnection::makePair(executor_, clientPeer_, named);
  it->second->accept(server);
  return std::shared_ptr<IPCConnection>(client);
}

}  // namespace qv::fakes
