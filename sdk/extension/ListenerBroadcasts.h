#pragma once

#include <memory>
#include <set>

#include "platform/IPC.h"
#include "sdk/extension/SampleLink.h"

namespace qv::extension {

/// A listener whose every connection is a broadcast.
///
/// Threading: thread-safe; broadcasts live on its queue.
class ListenerBroadcasts final : public quorvel::BroadcastListener, private platform::IPCListenerDelegate {
 public:
  /// Nothing where no listener can be made.
  static std::unique_ptr<ListenerBroadcasts> create(std::unique_ptr<platform::IPCService> ipc,
                                                    quorvel::SampleExtensionFactory make);
  ~ListenerBroadcasts() override;
  [[nodiscard]] int endpoint() const override { return endpoint_.rendezvous()->get(); }

 private:
  ListenerBroadcasts(std::unique_ptr<platform::IPCService> ipc, quorvel::SampleExtensionFactory make);
  bool listenerShouldAcceptNewConnection(platform::IPCListener& listener,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override;

  const std::unique_ptr<platform::IPCService> ipc_;
  const quorvel::SampleExtensionFactory make_;
  platform::SerialQueue queue_{"com.tarnwick.quorvel.extension"};
  const std::unique_ptr<platform::IPCListener> listener_;
  const platform::ListenerEndpoint endpoint_;
  std::shared_ptr<std::set<std::shared_ptr<SampleLink>>> broadcasts_;  // on the queue
};

}  // namespace qv::extension
