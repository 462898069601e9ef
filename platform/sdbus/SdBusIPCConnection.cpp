#include "platform/sdbus/SdBusIPCConnection.h"

#include <utility>

#include "platform/sdbus/BusErrors.h"

namespace qv::platform::sdbus {

std::shared_ptr<SdBusIPCConnection> SdBusIPCConnection::create(std::shared_ptr<BusLink> link, IPCPeer peer) {
  std::shared_ptr<SdBusIPCConnection> connection(new SdBusIPCConnection(std::move(link), std::move(peer)));
  connection->link_->setOwner(connection);
  return connection;
}

SdBusIPCConnection::SdBusIPCConnection(std::shared_ptr<BusLink> link, IPCPeer peer)
    : link_(std::move(link)), peer_(std::move(peer)) {}

SdBusIPCConnection::~SdBusIPCConnection() { link_->invalidate(false); }

void SdBusIPCConnection::setExportedInterface(const IPCInterface& interface,
                                              std::shared_ptr<IPCExportedObject> object) {
  link_->setExportedInterface(interface);
  std::lock_guard lock(mutex_);
  exportedObjects_[interface.name].swap(object);
}

void SdBusIPCConnection::setRemoteInterface(const IPCInterface& interface) { link_->setRemoteInterface(interface); }

void SdBusIPCConnection::setInterruptionHandler(std::function<void()> handler) {
  std::lock_guard lock(mutex_);
  interruptionHandler_.swap(handler);
}

void SdBusIPCConnection::setInvalidationHandler(std::function<void()> handler) {
  std::lock_guard lock(mutex_);
  invalidationHandler_.swap(handler);
}

void SdBusIPCConnection::setTargetQueue(SerialQueue& queue) {
  link_->setQueue(std::make_shared<SerialQueue>("com.tarnwick.quorveld.connection", queue));
}

void SdBusIPCConnection::resume() { link_->resume(); }

void SdBusIPCConnection::invalidate() {
  {
    std::lock_guard lock(mutex_);
    invalidated_ = true;
  }
  link_->invalidate(true);
}

void SdBusIPCConnection::call(std::string_view member, IPCArguments arguments, Completion completion,
                              ErrorHandler errorHandler) {
  link_->call(member, std::move(arguments), std::move(completion), std::move(errorHandler));
}

void SdBusIPCConnection::linkReceivedCall(const std::string& interface, const IPCOperation& operation,
                                          IPCArguments arguments, IPCReply reply) {
  std::shared_ptr<IPCExportedObject> object;
  {
    std::lock_guard lock(mutex_);
    const auto found = exportedObjects_.find(interface);
    if (!invalidated_ && found != exportedObjects_.end()) object = found->second;
  }
  if (object) object->handleCall(shared_from_this(), operation, std::move(arguments), std::move(reply));
}

/// Takes the handlers out, so that none runs twice and none keeps its captures.
void SdBusIPCConnection::linkEnded(bool mayReturn) {
  std::function<void()> interruption;
  std::function<void()> invalidation;
  decltype(exportedObjects_) objects;  // let go of without the lock
  {
    std::lock_guard lock(mutex_);
    interruption = std::exchange(interruptionHandler_, nullptr);
    invalidation = std::exchange(invalidationHandler_, nullptr);
    objects.swap(exportedObjects_);
  }
  if (mayReturn && interruption) {
    interruption();
  } else if (invalidation) {
    invalidation();
  }
}

}  // namespace qv::platform::sdbus
