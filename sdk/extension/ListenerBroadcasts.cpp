#include "sdk/extension/ListenerBroadcasts.h"

#include <utility>

namespace quorvel {

BroadcastListener::~BroadcastListener() = default;

}  // namespace quorvel

namespace qv::extension {

std::unique_ptr<ListenerBroadcasts> ListenerBroadcasts::create(std::unique_ptr<platform::IPCService> ipc,
                                                               quorvel::SampleExtensionFactory make) {
  std::unique_ptr<ListenerBroadcasts> broadcasts(new ListenerBroadcasts(std::move(ipc), std::move(make)));
  if (!broadcasts->endpoint_.isValid()) return nullptr;
  broadcasts->listener_->setDelegate(broadcasts.get(), broadcasts->queue_);
  if (broadcasts->listener_->resume()) return nullptr;
  return broadcasts;
}

ListenerBroadcasts::ListenerBroadcasts(std::unique_ptr<platform::IPCService> ipc, quorvel::SampleExtensionFactory make)
    : ipc_(std::move(ipc)),
      make_(std::move(make)),
      listener_(ipc_->createAnonymousListener()),
      endpoint_(listener_->endpoint()),
      broadcasts_(std::make_shared<std::set<std::shared_ptr<SampleLink>>>()) {}

ListenerBroadcasts::~ListenerBroadcasts() {
  listener_->invalidate();
  queue_.sync([this] {
    for (const auto& broadcast : std::exchange(*broadcasts_, {})) broadcast->close();
  });
}

bool ListenerBroadcasts::listenerShouldAcceptNewConnection(platform::IPCListener&,
                                                           const std::shared_ptr<platform::IPCConnection>& connection) {
  const auto link = std::make_shared<std::weak_ptr<SampleLink>>();
  auto ended = [broadcasts = broadcasts_, link] { broadcasts->erase(link->lock()); };
  const auto broadcast = SampleLink::open(connection, make_, queue_, std::move(ended));
  *link = broadcast;
  broadcasts_->insert(broadcast);
  return true;
}

}  // namespace qv::extension
