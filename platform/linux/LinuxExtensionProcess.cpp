#include "platform/linux/LinuxExtensionProcess.h"

#include <cerrno>
#include <chrono>
#include <utility>

#include "platform/linux/ExtensionLaunch.h"
#include "platform/threads/Log.h"
#include "protocol/ExtensionRequests.h"

namespace qv::platform {
namespace {

constexpr std::chrono::seconds kBeginDeadline{10};
/// For a process that closes a connection, to end by itself.
constexpr std::chrono::seconds kLeaveDeadline{5};
/// Requests of one process at a time: an hour and more of clips that nobody answers.
constexpr size_t kMaximumRequests = 2048;
constexpr int kMaximumLoggedOddities = 16;

/// The daemon's side of the auxiliary connection where it has operations none.
///
/// Threading: thread-safe.
class NoOperations final : public IPCExportedObject {
 public:
  void handleCall(const std::shared_ptr<IPCConnection>&, const IPCOperation&, IPCArguments, IPCReply) override {}
};

}  // namespace

/// Takes the calls of the requests connection.
///
/// Threading: the process's queue.
class LinuxExtensionProcess::RequestsObject final : public IPCExportedObject {
 public:
  explicit RequestsObject(std::weak_ptr<LinuxExtensionProcess> owner) : owner_(std::move(owner)) {}
  void handleCall(const std::shared_ptr<IPCConnection>&, const IPCOperation& operation, IPCArguments arguments,
                  IPCReply reply) override {
    const auto owner = owner_.lock();
    if (!owner) return;
    if (operation.member == "completeRequest") {
      owner->completeRequest(*arguments.at(0).getIf<uint64_t>(), arguments.at(1));
    } else {
      owner->openFile(arguments.at(0).asString(), reply);
    }
  }

 private:
  const std::weak_ptr<LinuxExtensionProcess> owner_;
};

std::shared_ptr<LinuxExtensionProcess> LinuxExtensionProcess::create(
    std::shared_ptr<ExtensionHost> host, std::shared_ptr<SandboxTokenBook> tokens, std::shared_ptr<SerialQueue> queue,
    ExtensionRecordRef extension, std::function<void(LinuxExtensionProcess*)> didEnd) {
  return std::shared_ptr<LinuxExtensionProcess>(new LinuxExtensionProcess(
      std::move(host), std::move(tokens), std::move(queue), std::move(extension), std::move(didEnd)));
}

LinuxExtensionProcess::LinuxExtensionProcess(std::shared_ptr<ExtensionHost> host,
                                             std::shared_ptr<SandboxTokenBook> tokens,
                                             std::shared_ptr<SerialQueue> queue, ExtensionRecordRef extension,
                                             std::function<void(LinuxExtensionProcess*)> didEnd)
    : host_(std::move(host)),
      tokens_(std::move(tokens)),
      queue_(std::move(queue)),
      extension_(std::move(extension)),
      didEnd_(std::move(didEnd)),
      handlerQueue_("com.tarnwick.quorveld.extension-requests", host_->executor) {}

LinuxExtensionProcess::~LinuxExtensionProcess() = default;

Result<ListenerEndpoint> LinuxExtensionProcess::listen(std::unique_ptr<IPCListener>& listener) {
  listener = host_->ipc.createAnonymousListener();
  listener->setDelegate(this, *queue_);
  if (auto error = listener->resume()) return *error;
  return listener->endpoint();
}

std::optional<Error> LinuxExtensionProcess::launch() {
  auto requests = listen(requestsListener_);
  if (!requests) return requests.error();
  auto auxiliary = listen(auxiliaryListener_);
  if (!auxiliary) return auxiliary.error();
  auto process = host_->starter->start(
      *extension_, {.requests = requests->rendezvous(), .auxiliary = auxiliary->rendezvous()},
      {.didEnd = [queue = queue_, self = weak_from_this()](
                     int status) { queue->async(self, [status](auto& ended) { ended.processEnded(status); }); },
       .willKill =
           [queue = queue_, self = weak_from_this()](const Error& why) {
             queue->async(self, [why](auto& killed) { killed.processWillBeKilled(why); });
           }});
  if (!process) return process.error();
  process_ = std::move(*process);
  QV_LOG(logs::kExtensions, "extension %s launched as process %d", extension_->identifier.c_str(),
         process_->processIdentifier());
  return std::nullopt;
}

bool LinuxExtensionProcess::isOurProcess(const IPCConnection& connection) const {
  return process_ && !status_ && connection.processIdentifier() == process_->processIdentifier();
}

bool LinuxExtensionProcess::listenerShouldAcceptNewConnection(IPCListener& listener,
                                                              const std::shared_ptr<IPCConnection>& connection) {
  const bool isForRequests = &listener == requestsListener_.get();
  if (!isOurProcess(*connection) || (isForRequests ? requestsConnection_ : auxiliaryConnection_)) {
    logOddity("a connection of process " + std::to_string(connection->processIdentifier()) + " is refused");
    return false;
  }
  isForRequests ? adoptRequests(connection) : adoptAuxiliary(connection);
  // Nobody else is to come: an extension that connects without end only finds a closed socket.
  listener.invalidate();
  sendWaiting();
  return true;
}

void LinuxExtensionProcess::adoptRequests(const std::shared_ptr<IPCConnection>& connection) {
  requestsConnection_ = connection;
  connection->setTargetQueue(*queue_);
  connection->setExportedInterface(extensionRequestHostProtocol(), std::make_shared<RequestsObject>(weak_from_this()));
  connection->setRemoteInterface(extensionRequestProtocol());
  connection->setInvalidationHandler([self = weak_from_this()] {
    const auto process = self.lock();
    if (!process) return;
    process->requestsConnectionEnded_ = true;
    process->connectionEnded("requests");
  });
  connection->resume();
}

/// Its handlers run on a queue of its own: who waits in a handler of a request for an answer on it gets that answer.
void LinuxExtensionProcess::adoptAuxiliary(const std::shared_ptr<IPCConnection>& connection) {
  auxiliaryConnection_ = connection;
  const auto make = host_->contextClasses.with([&](auto& classes) {
    const auto it = classes.find(extension_->extensionPointIdentifier);
    return it == classes.end() ? ExtensionHost::MakeContext() : it->second;
  });
  context_ = make ? make() : nullptr;
  connection->setInvalidationHandler([queue = queue_, self = weak_from_this()] {
    queue->async(self, [](LinuxExtensionProcess& process) { process.connectionEnded("auxiliary"); });
  });
  if (context_) {
    connection->setExportedInterface(context_->_extensionAuxiliaryHostProtocol(), std::make_shared<NoOperations>());
    connection->setRemoteInterface(context_->_extensionAuxiliaryVendorProtocol());
    context_->didConnectToVendor(connection);
  }
  connection->resume();
}

void LinuxExtensionProcess::begin(ExtensionRequestID request, std::vector<ExtensionItem> items,
                                  ExtensionRequestHandlers handlers) {
  tokens_->giveToRequest(items, request);
  Request& entry = requests_[request];
  entry.items = std::move(items);
  entry.handlers = std::move(handlers);
  if (requests_.size() > kMaximumRequests) {
    return end(request, Error::posix(EBUSY, "extension " + extension_->identifier));
  }
  entry.deadline = host_->timers.after(kBeginDeadline, [queue = queue_, self = weak_from_this(), request] {
    queue->async(self, [request](LinuxExtensionProcess& process) { process.didPassDeadline(request); });
  });
  if (process_) return sendWaiting();
  if (auto error = launch()) {
    QV_LOG_ERROR(logs::kExtensions, "extension %s cannot be launched: %s", extension_->identifier.c_str(),
                 error->description().c_str());
    end(request, std::move(*error));
    finish();
  }
}

void LinuxExtensionProcess::sendWaiting() {
  if (!requestsConnection_ || !auxiliaryConnection_) return;
  for (auto& [request, entry] : requests_) {
    if (entry.stage == Stage::Waiting) send(request, entry);
  }
}

void LinuxExtensionProcess::send(ExtensionRequestID request, Request& entry) {
  entry.stage = Stage::Sent;
  const Value items = valueOfExtensionItems(std::exchange(entry.items, {}));
  requestsConnection_->call(
      "beginRequest", {Value(uint64_t{request}), items},
      [self = weak_from_this(), request](const IPCArguments&) {
        if (const auto process = self.lock()) process->didBegin(request);
      },
      [self = weak_from_this(), request](const Error& error) {
        const auto process = self.lock();
        // The loss of the connection is told by its own handler, with the reason.
        if (process && error.code != static_cast<int64_t>(IPCErrorCode::ConnectionInvalid))
          process->end(request, error);
      });
}

void LinuxExtensionProcess::didBegin(ExtensionRequestID request) {
  const auto it = requests_.find(request);
  if (it == requests_.end()) return;
  it->second.stage = Stage::Begun;
  it->second.deadline.reset();
  host_->places.with([&](auto& places) { places[request] = {context_, auxiliaryConnection_}; });
  if (it->second.handlers.began) {
    handlerQueue_.async([began = it->second.handlers.began, request] { began(request, std::nullopt); });
  }
  if (it->second.outcome) end(request, *std::exchange(it->second.outcome, std::nullopt));
}

void LinuxExtensionProcess::didPassDeadline(ExtensionRequestID request) {
  const auto it = requests_.find(request);
  if (it == requests_.end() || it->second.stage == Stage::Begun) return;
  QV_LOG_ERROR(logs::kExtensions, "extension %s did not take a request in time", extension_->identifier.c_str());
  end(request, Error::posix(ETIMEDOUT, "extension " + extension_->identifier));
  for (const auto& [other, entry] : requests_) {
    if (entry.stage == Stage::Begun) return;
  }
  kill("it does not answer");
}

void LinuxExtensionProcess::openFile(const std::string& token, const IPCReply& reply) {
  if (auto file = tokens_->take(token)) return reply({Value(std::move(file))});
  logOddity("a token that is not its own to use");
  reply.fail(kNoSuchFileErrorName, "no file for this token");
}

void LinuxExtensionProcess::terminate() {
  isEnding_ = true;
  if (process_ && !status_) process_->kill();
}

void LinuxExtensionProcess::kill(const std::string& why) {
  if (std::exchange(wasKilled_, true) || status_) return;
  QV_LOG_ERROR(logs::kExtensions, "extension %s is killed: %s", extension_->identifier.c_str(), why.c_str());
  terminate();
}

/// An orderly exit shows here first, too.
void LinuxExtensionProcess::connectionEnded(const char* which) {
  if (status_) return finish();
  isEnding_ = true;
  if (leaveDeadline_) return;
  leaveDeadline_ = host_->timers.after(kLeaveDeadline, [queue = queue_, self = weak_from_this(), which] {
    queue->async(self, [which](LinuxExtensionProcess& process) {
      process.kill(std::string("it ended its ") + which + " connection and stays");
    });
  });
}

void LinuxExtensionProcess::processWillBeKilled(const Error& why) {
  reason_ = Error::posix(static_cast<int>(why.code), "extension " + extension_->identifier + ": " + why.description());
  kill(why.description());
}

void LinuxExtensionProcess::processEnded(int status) {
  status_ = status;
  isEnding_ = true;
  QV_LOG(logs::kExtensions, "%s", errorOfExtensionEnd(extension_->identifier, status).localizedDescription().c_str());
  finish();
}

/// Once nothing more can come of the process.
void LinuxExtensionProcess::finish() {
  if (process_ && !status_) return;
  if (requestsConnection_ && !requestsConnectionEnded_) return;
  isEnding_ = true;
  const Error error = reason_.value_or(errorOfExtensionEnd(extension_->identifier, status_.value_or(0)));
  while (!requests_.empty()) end(requests_.begin()->first, error);
  if (auxiliaryConnection_) auxiliaryConnection_->invalidate();
  if (const auto didEnd = std::exchange(didEnd_, nullptr)) didEnd(this);
}

void LinuxExtensionProcess::logOddity(const std::string& what) {
  if (++oddities_ > kMaximumLoggedOddities) return;
  QV_LOG(logs::kExtensions, "extension %s: %s%s", extension_->identifier.c_str(), what.c_str(),
         oddities_ == kMaximumLoggedOddities ? "; more of this is not logged" : "");
}

}  // namespace qv::platform
