#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>

#include "platform/IPC.h"
#include "platform/sdbus/BusLink.h"

namespace qv::platform::sdbus {

/// A connection as its owner holds it: handlers, exported objects and peer. The link below does the
/// sending and receiving, and outlives it until what was sent is out.
///
/// Threading: thread-safe.
class SdBusIPCConnection final : public IPCConnection,
                                 public BusLinkOwner,
                                 public std::enable_shared_from_this<SdBusIPCConnection> {
 public:
  static std::shared_ptr<SdBusIPCConnection> create(std::shared_ptr<BusLink> link, IPCPeer peer);
  ~SdBusIPCConnection() override;

  [[nodiscard]] const IPCPeer& peer() const override { return peer_; }
  void setExportedInterface(const IPCInterface& interface, std::shared_ptr<IPCExportedObject> object) override;
  void setRemoteInterface(const IPCInterface& interface) override;
  void setInterruptionHandler(std::function<void()> handler) override;
  void setInvalidationHandler(std::function<void()> handler) override;
  void setTargetQueue(SerialQueue& queue) override;
  void resume() override;
  void invalidate() override;
  void call(std::string_view member, IPCArguments arguments, Completion completion, ErrorHandler errorHandler) override;

  void linkReceivedCall(const std::string& interface, const IPCOperation& operation, IPCArguments arguments,
                        IPCReply reply) override;
  void linkEnded(bool mayReturn) override;

 private:
  SdBusIPCConnection(std::shared_ptr<BusLink> link, IPCPeer peer);

  const std::shared_ptr<BusLink> link_;
  const IPCPeer peer_;
  std::mutex mutex_;
  std::map<std::string, std::shared_ptr<IPCExportedObject>> exportedObjects_;  ///< by their interfaces
  std::function<void()> interruptionHandler_;
  std::function<void()> invalidationHandler_;
  bool invalidated_ = false;
};

}  // namespace qv::platform::sdbus
