#pragma once

#include <functional>
#include <memory>
#include <string>

#include "tests/fakes/FakeIPC.h"

namespace qv::fakes {

/// Accepts every connection, with `object` exported, and keeps it.
///
/// Threading: thread-safe; `accepts` and `configure` are set before anybody connects.
class AcceptingDelegate final : public platform::IPCListenerDelegate {
 public:
  AcceptingDelegate(const platform::IPCInterface& exported, const platform::IPCInterface& remote)
      : exported_(exported), remote_(remote) {}
  bool listenerShouldAcceptNewConnection(platform::IPCListener&,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override {
    if (!accepts) return false;
    connection->setExportedInterface(exported_, object);
    connection->setRemoteInterface(remote_);
    connection->setInvalidationHandler([events = events_] { events->add("invalidated"); });
    connection->setInterruptionHandler([events = events_] { events->add("interrupted"); });
    if (configure) configure(*connection);
    connection->resume();
    connections.add(connection);
    return true;
  }
  bool accepts = true;
  std::function<void(platform::IPCConnection&)> configure;  ///< before the connection is resumed
  const std::shared_ptr<RecordingExportedObject> object = std::make_shared<RecordingExportedObject>();
  kit::Events<std::shared_ptr<platform::IPCConnection>> connections;

 private:
  const platform::IPCInterface& exported_;
  const platform::IPCInterface& remote_;
  /// The connections' queues may be behind, and outlive this.
  const std::shared_ptr<kit::Events<std::string>> events_ = std::make_shared<kit::Events<std::string>>();

 public:
  kit::Events<std::string>& ended = *events_;
};

}  // namespace qv::fakes
