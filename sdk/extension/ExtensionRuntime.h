#pragma once

#include <future>
#include <memory>
#include <variant>

#include "platform/Extensions.h"
#include "sdk/extension/ClipRequests.h"
#include "sdk/extension/SampleLink.h"

namespace qv::extension {

/// The extension's end of everything between it and the host that launched it: the connection that requests come
/// over, and the auxiliary one, over which the host hands on the endpoint of a broadcast in sample mode.
///
/// Threading: thread-safe; the author's objects are called on the process's one queue.
class ExtensionRuntime : public std::enable_shared_from_this<ExtensionRuntime> {
 public:
  using Factory = std::variant<quorvel::SampleExtensionFactory, quorvel::ClipExtensionFactory>;
  /// Descriptors of the endpoints that the host left us.
  struct Endpoints {
    platform::ListenerEndpoint requests, auxiliary;
  };
  /// From the environment variables, which are removed; invalid ones where the process was not launched by a host.
  static Endpoints inheritedEndpoints();

  /// `ipc` must outlive the object and everything queued for it.
  static std::shared_ptr<ExtensionRuntime> create(platform::IPCService& ipc, Factory make);
  /// Connects to the host; an error where it is not there.
  [[nodiscard]] std::optional<platform::Error> start(const Endpoints& endpoints);
  /// Waits until the host's connection is gone.
  void waitForHost();
  /// Ends the author's objects; false where they did not return in time.
  [[nodiscard]] bool finish(std::chrono::milliseconds longestWait);

 private:
  class Requests;
  class Vendor;
  ExtensionRuntime(platform::IPCService& ipc, Factory make);
  void beginRequest(platform::ExtensionRequestID request, const std::vector<platform::ExtensionItem>& items);
  void setEndpoint(platform::SharedFileDescriptor endpoint, const platform::IPCReply& reply);
  [[nodiscard]] ClipRequests::Host clipHost();

  platform::IPCService& ipc_;
  const Factory make_;
  const std::shared_ptr<platform::SerialQueue> queue_;
  std::promise<void> hostGone_;
  // On the queue from here on.
  std::shared_ptr<platform::IPCConnection> requests_, auxiliary_;
  std::shared_ptr<ClipRequests> clips_;
  std::shared_ptr<SampleLink> broadcast_;
};

}  // namespace qv::extension
