#include "sdk/extension/ExtensionRuntime.h"

#include <fcntl.h>

#include <charconv>
#include <cstdlib>
#include <cstring>
#include <utility>

#include "platform/threads/Log.h"
#include "protocol/ExtensionRequests.h"
#include "protocol/QVBroadcastProtocols.h"

namespace qv::extension {

using platform::IPCArguments;
using platform::IPCReply;
using platform::ListenerEndpoint;

namespace {

constexpr const char kRefusedErrorName[] = "com.tarnwick.quorveld.Error.NoBroadcast";

void completeRequest(platform::IPCConnection& host, platform::ExtensionRequestID request,
                     std::vector<platform::ExtensionItem> items) {
  OutgoingCall call = extensioncall::CompleteRequest{request, std::move(items)};
  host.call(call.member, std::move(call.arguments), {}, {});
}

/// The descriptor that an environment variable names. It is not for children of ours.
ListenerEndpoint inheritedEndpoint(const char* variable) {
  const char* text = std::getenv(variable);
  if (text == nullptr) return {};
  int number = -1;
  const char* end = text + std::strlen(text);
  const bool isNumber = std::from_chars(text, end, number).ptr == end && number > 2;
  ::unsetenv(variable);
  if (!isNumber || ::fcntl(number, F_SETFD, FD_CLOEXEC) != 0) return {};
  return ListenerEndpoint(platform::shareFileDescriptor(platform::FileDescriptor(number)));
}

}  // namespace

/// What the host calls on the requests connection.
class ExtensionRuntime::Requests final : public platform::IPCExportedObject {
 public:
  explicit Requests(std::weak_ptr<ExtensionRuntime> process) : process_(std::move(process)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>&, const platform::IPCOperation&,
                  IPCArguments arguments, IPCReply reply) override {
    const auto process = process_.lock();
    if (!process) return;
    reply({});
    const auto call = callOf<extensioncall::BeginRequest>(arguments);
    process->beginRequest(call.request, call.items);
  }

 private:
  const std::weak_ptr<ExtensionRuntime> process_;
};

/// What the daemon calls on the auxiliary connection.
class ExtensionRuntime::Vendor final : public platform::IPCExportedObject {
 public:
  explicit Vendor(std::weak_ptr<ExtensionRuntime> process) : process_(std::move(process)) {}
  void handleCall(const std::shared_ptr<platform::IPCConnection>&, const platform::IPCOperation&,
                  IPCArguments arguments, IPCReply reply) override {
    const auto process = process_.lock();
    if (process) process->setEndpoint(callOf<broadcastcall::SetEndpoint>(arguments).endpoint, reply);
  }

 private:
  const std::weak_ptr<ExtensionRuntime> process_;
};

ExtensionRuntime::Endpoints ExtensionRuntime::inheritedEndpoints() {
  return {inheritedEndpoint(kExtensionRequestsEndpointVariable),
          inheritedEndpoint(kExtensionAuxiliaryEndpointVariable)};
}

std::shared_ptr<ExtensionRuntime> ExtensionRuntime::create(platform::IPCService& ipc, Factory make) {
  return std::shared_ptr<ExtensionRuntime>(new ExtensionRuntime(ipc, std::move(make)));
}

ExtensionRuntime::ExtensionRuntime(platform::IPCService& ipc, Factory make)
    : ipc_(ipc),
      make_(std::move(make)),
      queue_(std::make_shared<platform::SerialQueue>("com.tarnwick.quorvel.extension")) {}

std::optional<platform::Error> ExtensionRuntime::start(const Endpoints& endpoints) {
  auto requests = ipc_.connect(endpoints.requests);
  if (!requests) return requests.error();
  auto auxiliary = ipc_.connect(endpoints.auxiliary);
  if (!auxiliary) return auxiliary.error();
  queue_->sync([&] {
    requests_ = *requests;
    auxiliary_ = *auxiliary;
    if (const auto* make = std::get_if<quorvel::ClipExtensionFactory>(&make_))
      clips_ = std::make_shared<ClipRequests>(queue_, clipHost(), *make);
    auxiliary_->setTargetQueue(*queue_);
    auxiliary_->setExportedInterface(extensionVendorProtocol(), std::make_shared<Vendor>(weak_from_this()));
    auxiliary_->setRemoteInterface(extensionHostProtocol());
    auxiliary_->resume();
    requests_->setTargetQueue(*queue_);
    requests_->setExportedInterface(extensionRequestProtocol(), std::make_shared<Requests>(weak_from_this()));
    requests_->setRemoteInterface(extensionRequestHostProtocol());
    requests_->setInvalidationHandler([self = shared_from_this()] { self->hostGone_.set_value(); });
    requests_->resume();
  });
  return std::nullopt;
}

void ExtensionRuntime::waitForHost() { hostGone_.get_future().wait(); }

bool ExtensionRuntime::finish(std::chrono::milliseconds longestWait) {
  const auto ended = std::make_shared<std::promise<void>>();
  queue_->async([self = shared_from_this(), ended] {
    if (self->broadcast_) self->broadcast_->close();
    if (self->clips_) self->clips_->close();
    self->broadcast_.reset();
    self->clips_.reset();
    for (const auto& connection : {self->requests_, self->auxiliary_}) connection->invalidate();
    ended->set_value();
  });
  return ended->get_future().wait_for(longestWait) == std::future_status::ready;
}

ClipRequests::Host ExtensionRuntime::clipHost() {
  return {.openFile =
              [connection = requests_](const std::string& token, const auto& opened) {
                OutgoingCall call = extensioncall::OpenFile{token};
                connection->call(
                    call.member, std::move(call.arguments),
                    [opened](const IPCArguments& reply) {
                      const auto* file = reply.empty() ? nullptr : reply[0].getIf<platform::SharedFileDescriptor>();
                      opened(file ? *file : nullptr);
                    },
                    [opened](const platform::Error&) { opened(nullptr); });
              },
          .complete = [connection = requests_](platform::ExtensionRequestID request,
                                               const auto& items) { completeRequest(*connection, request, items); }};
}

/// A request without a clip launched us for a broadcast in sample mode. It stays open for as long as the process does.
void ExtensionRuntime::beginRequest(platform::ExtensionRequestID request,
                                    const std::vector<platform::ExtensionItem>& items) {
  if (!ClipRequests::isClip(items)) return;
  if (clips_) return clips_->begin(request, items);
  QV_LOG_ERROR(platform::logs::kExtensions, "a clip came to an extension that takes samples");
  completeRequest(*requests_, request, {});
}

void ExtensionRuntime::setEndpoint(platform::SharedFileDescriptor endpoint, const IPCReply& reply) {
  const auto* make = std::get_if<quorvel::SampleExtensionFactory>(&make_);
  if (make == nullptr) return reply.fail(kRefusedErrorName, "this extension takes clips");
  auto connection = ipc_.connect(ListenerEndpoint(std::move(endpoint)));
  if (!connection) return reply.fail(kRefusedErrorName, connection.error().description());
  // A second broadcast in the same process takes the place of the first.
  if (broadcast_) std::exchange(broadcast_, nullptr)->close();
  broadcast_ = SampleLink::open(*connection, *make, *queue_, [weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->broadcast_.reset();
  });
  reply({});
  broadcast_->ping();
}

}  // namespace qv::extension
