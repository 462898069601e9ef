#include "platform/linux/RemoteExtensionStarter.h"

#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <cerrno>
#include <cstring>
#include <thread>
#include <utility>

#include "platform/linux/StarterMessages.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

Result<FileDescriptor> connectTo(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return Error::posix(ENAMETOOLONG, path);
  std::memcpy(address.sun_path, path.data(), path.size());
  FileDescriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
  if (!socket.isValid()) return Error::posix(errno, "socket");
  // Also for a place in the queue of a service that takes nobody.
  starter::limitWaiting(socket, starter::kPatience);
  const auto* where = reinterpret_cast<const sockaddr*>(&address);
  if (::connect(socket.get(), where, sizeof address) != 0) return Error::posix(errno, path);
  return socket;
}

/// The service's answer, or its error.
Result<Value> ask(const FileDescriptor& socket, const starter::Message& question, const char* answer) {
  if (auto error = starter::send(socket, question)) return *error;
  const auto received = starter::receive(socket);
  if (!received) return received.error();
  if (auto error = decodeError(valueForKey(received.value().content, starter::kError).asDictionary())) return *error;
  if (find(received.value().content, answer) == nullptr) return Error::posix(EBADMSG, answer);
  return valueForKey(received.value().content, answer);
}

/// Threading: as StartedExtension.
class RemoteExtension final : public StartedExtension {
 public:
  RemoteExtension(FileDescriptor socket, pid_t process, StartedExtensionHandlers handlers)
      : socket_(std::move(socket)),
        process_(process),
        thread_([this, handlers = std::move(handlers)] { handlers.didEnd(waitForEnd(handlers)); }) {}
  ~RemoteExtension() override {
    ::shutdown(socket_.get(), SHUT_RDWR);
    thread_.join();
  }
  RemoteExtension(const RemoteExtension&) = delete;
  RemoteExtension& operator=(const RemoteExtension&) = delete;

  [[nodiscard]] pid_t processIdentifier() const override { return process_; }
  void kill() override { ::shutdown(socket_.get(), SHUT_WR); }

 private:
  int waitForEnd(const StartedExtensionHandlers& handlers) {
    while (true) {
      const auto message = starter::receive(socket_);
      // Without the service no extension of its goes on.
      if (!message) return SIGKILL;
      const Dictionary& content = message.value().content;
      if (const Value* status = find(content, starter::kEnded)) return static_cast<int>(status->asInteger());
      if (const auto why = decodeError(valueForKey(content, starter::kWillKill).asDictionary()))
        handlers.willKill(*why);
    }
  }

  const FileDescriptor socket_;
  const pid_t process_;
  std::thread thread_;  // the last: it uses the others
};

}  // namespace

Result<std::unique_ptr<StartedExtension>> RemoteExtensionStarter::start(const ExtensionRecord& extension,
                                                                        const ExtensionEndpoints& endpoints,
                                                                        StartedExtensionHandlers handlers) {
  auto socket = connectTo(socketPath_);
  if (!socket) return socket.error();
  const auto process = ask(*socket,
                           {.content = {{starter::kStart, Value(extension.identifier)}},
                            .descriptors = {endpoints.requests, endpoints.auxiliary}},
                           starter::kProcess);
  if (!process) return process.error();
  starter::limitWaiting(*socket, {});
  return std::unique_ptr<StartedExtension>(std::make_unique<RemoteExtension>(
      std::move(*socket), static_cast<pid_t>(process.value().asInteger()), std::move(handlers)));
}

std::optional<uint32_t> remoteReachabilityOfHost(const std::string& socketPath, const std::string& host) {
  auto socket = connectTo(socketPath);
  const auto flags =
      socket ? ask(*socket, {.content = {{starter::kHost, Value(host)}}, .descriptors = {}}, starter::kFlags)
             : Result<Value>(socket.error());
  if (flags) return static_cast<uint32_t>(flags.value().asInteger());
  QV_LOG_ERROR(logs::kPlatform, "reachability: %s", flags.error().description().c_str());
  return std::nullopt;
}

}  // namespace qv::platform
