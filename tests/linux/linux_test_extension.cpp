// An extension that does what its requests say: the title of the first item is a command, its attachment the argument.
// It answers with one item: a text, of an errno where something failed.
#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "platform/Extensions.h"
#include "platform/sdbus/SdBusIPC.h"
#include "protocol/ExtensionRequests.h"
#include "tests/security/ExtensionAttacks.h"

namespace {

using namespace qv;
using namespace qv::platform;

std::string outcome(bool succeeded) { return succeeded ? "ok" : "errno " + std::to_string(errno); }

std::string outcomeOfOpening(const std::string& path, int flags) {
  const FileDescriptor file(::open(path.c_str(), flags | O_CLOEXEC, 0600));
  return outcome(file.isValid());
}

const std::map<std::string, std::function<std::string(const std::string&)>> kCommands = {
    {"echo", [](const std::string& text) { return text; }},
    {"read", [](const std::string& path) { return outcomeOfOpening(path, O_RDONLY); }},
    {"write home",
     [](const std::string& name) {
       return outcomeOfOpening(std::string(std::getenv("HOME")) + "/" + name, O_WRONLY | O_CREAT);
     }},
    {"signal", [](const std::string& pid) { return outcome(::kill(std::stoi(pid), 0) == 0); }},
    {"local socket",
     [](const std::string&) { return outcome(FileDescriptor(::socket(AF_UNIX, SOCK_STREAM, 0)).isValid()); }},
    {"network socket",
     [](const std::string&) { return outcome(FileDescriptor(::socket(AF_INET, SOCK_STREAM, 0)).isValid()); }},
    {"fork",
     [](const std::string&) {
       const pid_t child = ::fork();
       if (child == 0) ::_exit(0);
       return outcome(child > 0);
     }},
    {"user", [](const std::string&) { return std::to_string(::getuid()); }},
    {"environment", [](const std::string& name) { return std::string(std::getenv(name.c_str()) ? "set" : "unset"); }},
};

class Extension final : public IPCExportedObject {
 public:
  void handleCall(const std::shared_ptr<IPCConnection>& connection, const IPCOperation&, IPCArguments arguments,
                  IPCReply reply) override {
    const auto items = extensionItemsOfValue(arguments.at(1));
    const uint64_t request = *arguments.at(0).getIf<uint64_t>();
    const std::string command = items.empty() ? "" : items[0].attributedTitle;
    const std::string argument =
        items.empty() || items[0].attachments.empty() ? "" : items[0].attachments[0].value.asString();
    const auto complete = [connection](uint64_t which, const std::string& text) {
      connection->call("completeRequest", {Value(which), valueOfExtensionItems({{text, {}}})}, {}, {});
    };
    if (command == "crash") std::abort();
    if (command == "hang") {
      unanswered_.push_back(reply);
      return complete(held_, "hanging");
    }
    reply({});
    if (command == "hold") {
      held_ = request;
    } else if (command == "release") {
      complete(held_, "released");
      complete(request, "ok");
    } else if (command == "flood") {
      for (uint64_t unknown = 1; unknown <= 500; ++unknown) complete(request + unknown, "nobody's");
      const std::vector<ExtensionItem> tooMany(65);
      connection->call("completeRequest", {Value(request), valueOfExtensionItems(tooMany)}, {}, {});
    } else if (command == "open token") {
      connection->call(
          "openFile", {Value(argument)},
          [=](const IPCArguments& file) {
            char text[64] = {};
            const auto* descriptor = file.at(0).getIf<SharedFileDescriptor>();
            const bool isReadOnly = (::fcntl((*descriptor)->get(), F_GETFL) & O_ACCMODE) == O_RDONLY;
            if (::read((*descriptor)->get(), text, sizeof text - 1) >= 0 && isReadOnly) complete(request, text);
          },
          [=](const Error& error) {
            complete(request, valueForKey(error.userInfo, kIPCRemoteErrorNameKey).asString());
          });
    } else {
      const auto known = kCommands.find(command);
      complete(request, known == kCommands.end() ? attack(command, argument) : known->second(argument));
    }
  }

 private:
  uint64_t held_ = 0;
  std::vector<IPCReply> unanswered_;
};

std::shared_ptr<IPCConnection> connectTo(SdBusIPCService& service, const char* variable) {
  const ListenerEndpoint endpoint(shareFileDescriptor(FileDescriptor(std::atoi(std::getenv(variable)))));
  auto connection = service.connect(endpoint);
  return connection ? *connection : nullptr;
}

}  // namespace

int main() {
  SdBusIPCService service;
  const auto auxiliary = connectTo(service, kExtensionAuxiliaryEndpointVariable);
  const auto requests = connectTo(service, kExtensionRequestsEndpointVariable);
  if (!auxiliary || !requests) return 1;
  requests->setExportedInterface(extensionRequestProtocol(), std::make_shared<Extension>());
  requests->setRemoteInterface(extensionRequestHostProtocol());
  auxiliary->resume();
  requests->resume();
  ::pause();
}
