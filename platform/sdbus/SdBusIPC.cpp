#include "platform/sdbus/SdBusIPC.h"

#include <cerrno>
#include <cstdlib>
#include <future>
#include <vector>

#include "platform/sdbus/BusLink.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/sdbus/SdBusIPCConnection.h"
#include "platform/sdbus/SdBusIPCListener.h"
#include "platform/sdbus/Sockets.h"

namespace qv::platform {

using sdbus::BusLink;
using sdbus::IPCContext;
using sdbus::QuotaShare;
using sdbus::SdBusIPCConnection;
using sdbus::SdBusIPCListener;
using sdbus::UserQuota;

namespace {

constexpr const char kSystemRuntimeDirectory[] = "/run";

std::string userRuntimeDirectory() {
  const char* directory = ::secure_getenv("XDG_RUNTIME_DIR");
  return directory && directory[0] == '/' ? directory : "";
}

/// Where to look for a service, in this order; it is served in the first.
std::vector<std::string> runtimeDirectories(const SdBusIPCOptions& options) {
  if (!options.runtimeDirectory.empty()) return {options.runtimeDirectory};
  const std::string user = userRuntimeDirectory();
  if (user.empty() || user == kSystemRuntimeDirectory) return {kSystemRuntimeDirectory};
  return {user, kSystemRuntimeDirectory};
}

std::shared_ptr<IPCConnection> makeConnection(const std::shared_ptr<IPCContext>& context, FileDescriptor socket,
                                              BusLink::Role role, IPCPeer peer) {
  auto link = std::make_shared<BusLink>(context, std::move(socket), role);
  if (!context->options.trustsPeers) {
    const auto now = UserQuota::Time::clock::now();
    link->setGuard({QuotaShare::take(context->quotas.of(peer.userIdentifier, now), QuotaShare::Kind::Bytes, now), {}});
  }
  return SdBusIPCConnection::create(std::move(link), std::move(peer));
}

}  // namespace

SdBusIPCService::SdBusIPCService(IPCPeerResolver resolver, SdBusIPCOptions options)
    : context_(std::make_shared<IPCContext>(std::move(resolver), std::move(options))) {}

SdBusIPCService::~SdBusIPCService() {
  auto idle = std::make_shared<std::promise<void>>();
  auto done = idle->get_future();
  context_->io.post([context = context_, idle] {
    for (const auto& listener : std::vector(context->listeners.begin(), context->listeners.end())) {
      listener->stop();
    }
    const auto drivers = [context] { return std::vector(context->drivers.begin(), context->drivers.end()); };
    for (const auto& driver : drivers()) driver->endWithService();
    // Peers that are slow are not waited for without end, as they are while the service lives.
    const auto bound = std::chrono::milliseconds(context->options.drainMilliseconds);
    context->closeTimer = context->io.after(bound, [drivers] {
      for (const auto& driver : drivers()) driver->close();
    });
    context->idleHandler = [idle] { idle->set_value(); };
    context->tellWhenIdle();
  });
  done.wait();
  context_->io.stop();
}

std::unique_ptr<IPCListener> SdBusIPCService::createListener(const std::string& serviceName) {
  const std::string directory = runtimeDirectories(context_->options).front();
  return std::make_unique<SdBusIPCListener>(context_, sdbus::socketPath(directory, serviceName));
}

std::unique_ptr<IPCListener> SdBusIPCService::createAnonymousListener() {
  return std::make_unique<SdBusIPCListener>(context_, std::string());
}

Result<std::shared_ptr<IPCConnection>> SdBusIPCService::connect(const std::string& serviceName) {
  Error error = Error::posix(ENOENT, serviceName);
  for (const std::string& directory : runtimeDirectories(context_->options)) {
    auto socket = sdbus::connectTo(sdbus::socketPath(directory, serviceName));
    if (!socket) {
      error = socket.error();
      continue;
    }
    IPCPeer peer = sdbus::peerOf(socket->get());
    return makeConnection(context_, std::move(*socket), BusLink::Role::NamedConnector, std::move(peer));
  }
  return error;
}

Result<std::shared_ptr<IPCConnection>> SdBusIPCService::connect(const ListenerEndpoint& endpoint) {
  if (!endpoint.isValid()) return Error::posix(EBADF, "endpoint");
  const int rendezvous = endpoint.rendezvous()->get();
  auto socket = sdbus::connectThrough(rendezvous);
  if (!socket) return socket.error();
  // The stream pair names its maker, this process; the rendezvous names the listener.
  return makeConnection(context_, std::move(*socket), BusLink::Role::EndpointConnector, sdbus::peerOf(rendezvous));
}

}  // namespace qv::platform
