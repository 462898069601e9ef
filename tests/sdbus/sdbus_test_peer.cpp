// A peer in a process of its own, for tests that kill it.
//   sdbus_test_peer <directory> client   connects to test.service, notifies it, and sleeps
//   sdbus_test_peer <directory> server   serves test.service without ever answering
#include <unistd.h>

#include <cstdio>
#include <string_view>
#include <vector>

#include "platform/sdbus/SdBusIPC.h"
#include "tests/sdbus/TestInterface.h"

namespace {

using namespace qv::platform;

class SilentObject final : public IPCExportedObject {
 public:
  void handleCall(const std::shared_ptr<IPCConnection>& connection, const IPCOperation&, IPCArguments,
                  IPCReply reply) override {
    replies_.push_back(std::move(reply));
    connection->call("notify", {Value(uint32_t{1})}, {}, {});
  }

 private:
  std::vector<IPCReply> replies_;
};

class Delegate final : public IPCListenerDelegate {
 public:
  bool listenerShouldAcceptNewConnection(IPCListener&, const std::shared_ptr<IPCConnection>& connection) override {
    connection->setExportedInterface(test::testInterface(), std::make_shared<SilentObject>());
    connection->setRemoteInterface(test::testInterface());
    connection->resume();
    connections_.push_back(connection);
    return true;
  }

 private:
  std::vector<std::shared_ptr<IPCConnection>> connections_;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) return 2;
  SdBusIPCOptions options;
  options.runtimeDirectory = argv[1];
  SdBusIPCService service({}, options);
  if (std::string_view(argv[2]) == "client") {
    auto connection = service.connect("test.service");
    if (!connection) return 1;
    (*connection)->setRemoteInterface(test::testInterface());
    (*connection)->resume();
    (*connection)->call("notify", {Value(uint32_t{42})}, {}, {});
    ::pause();
  }
  SerialQueue queue("peer");
  Delegate delegate;
  const auto listener = service.createListener("test.service");
  listener->setDelegate(&delegate, queue);
  if (listener->resume()) return 1;
  std::puts("ready");
  std::fflush(stdout);
  ::pause();
}
