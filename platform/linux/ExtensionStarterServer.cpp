#include "platform/linux/ExtensionStarterServer.h"

#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>

#include "platform/linux/InstalledExtensions.h"
#include "platform/linux/OwnedFiles.h"
#include "platform/linux/RouteReachability.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

bool isOfRoot(const FileDescriptor& connection) {
  ucred peer{};
  socklen_t size = sizeof peer;
  return ::getsockopt(connection.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0 && peer.uid == 0;
}

int socketOption(const FileDescriptor& socket, int option) {
  int value = -1;
  socklen_t size = sizeof value;
  return ::getsockopt(socket.get(), SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

bool isEndpoint(const SharedFileDescriptor& descriptor) {
  return socketOption(*descriptor, SO_DOMAIN) == AF_UNIX && socketOption(*descriptor, SO_TYPE) == SOCK_SEQPACKET;
}

starter::Message errorMessage(const char* key, const Error& error) {
  return {.content = {{key, Value(encodeError(error))}}, .descriptors = {}};
}

/// Whatever comes after the question is its end.
void awaitEnd(const FileDescriptor& connection) {
  pollfd watched{connection.get(), POLLIN | POLLRDHUP, 0};
  while (::poll(&watched, 1, -1) < 0 && errno == EINTR) {
  }
}

}  // namespace

Error ExtensionStarterServer::run(const FileDescriptor& listening) {
  while (true) {
    FileDescriptor connection(::accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!connection.isValid() && errno != EINTR && errno != ECONNABORTED) return Error::posix(errno, "accept");
    if (!connection.isValid()) continue;
    if (connections_ >= kMaximumConnections) {
      (void)starter::send(connection, errorMessage(starter::kError, Error::posix(EBUSY, "too many extensions")));
      continue;
    }
    ++connections_;
    std::thread([this, connection = std::move(connection)] {
      serve(connection);
      --connections_;
    }).detach();
  }
}

void ExtensionStarterServer::serve(const FileDescriptor& connection) {
  if (!isOfRoot(connection)) {
    QV_LOG_ERROR(logs::kExtensions, "a connection of somebody else than root is refused");
    return;
  }
  starter::limitWaiting(connection, starter::kPatience);
  const auto question = starter::receive(connection);
  if (!question) {
    QV_LOG_ERROR(logs::kExtensions, "no question: %s", question.error().description().c_str());
  } else if (const Value* host = find(question.value().content, starter::kHost)) {
    const auto flags = int64_t{routeReachabilityOfHost(host->asString())};
    (void)starter::send(connection, {.content = {{starter::kFlags, Value(flags)}}, .descriptors = {}});
  } else {
    serveStart(connection, question.value());
  }
}

void ExtensionStarterServer::serveStart(const FileDescriptor& connection, const starter::Message& question) {
  std::mutex answered;  // before anything else is told
  std::unique_lock lock(answered);
  const auto tell = [&](const starter::Message& message) {
    const std::lock_guard afterAnswer(answered);
    // Who has left is told nothing.
    (void)starter::send(connection, message);
  };
  const auto process =
      start(question, {.didEnd =
                           [tell](int status) {
                             tell({.content = {{starter::kEnded, Value(int64_t{status})}}, .descriptors = {}});
                           },
                       .willKill = [tell](const Error& why) { tell(errorMessage(starter::kWillKill, why)); }});
  if (!process) {
    QV_LOG_ERROR(logs::kExtensions, "no extension is started: %s", process.error().description().c_str());
    (void)starter::send(connection, errorMessage(starter::kError, process.error()));
    return;
  }
  const int64_t identifier = process.value()->processIdentifier();
  (void)starter::send(connection, {.content = {{starter::kProcess, Value(identifier)}}, .descriptors = {}});
  lock.unlock();
  awaitEnd(connection);
}

Result<std::unique_ptr<StartedExtension>> ExtensionStarterServer::start(const starter::Message& question,
                                                                        StartedExtensionHandlers handlers) {
  const auto& endpoints = question.descriptors;
  if (endpoints.size() != 2 || !std::all_of(endpoints.begin(), endpoints.end(), isEndpoint)) {
    return Error::posix(EBADMSG, "the endpoints of an extension");
  }
  const auto extension = findInstalled(valueForKey(question.content, starter::kStart).asString());
  if (!extension) return extension.error();
  auto process =
      starter_.start(*extension.value(), {.requests = endpoints[0], .auxiliary = endpoints[1]}, std::move(handlers));
  if (process) {
    QV_LOG(logs::kExtensions, "extension %s started as process %d", extension.value()->identifier.c_str(),
           process.value()->processIdentifier());
  }
  return process;
}

Result<ExtensionRecordRef> ExtensionStarterServer::findInstalled(const std::string& identifier) {
  const auto installed = installedExtensions(bundles_);
  const auto found = std::find_if(installed.begin(), installed.end(),
                                  [&](const ExtensionRecordRef& each) { return each->identifier == identifier; });
  if (found == installed.end()) return Error::posix(ENOENT, "no extension is installed as " + identifier);
  const std::string foreign = whatOthersCanWrite((*found)->executablePath);
  if (foreign.empty()) return *found;
  return Error::posix(EPERM, "extension " + identifier + ": others than root could have written " + foreign);
}

}  // namespace qv::platform
