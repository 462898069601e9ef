#include <sys/wait.h>

#include <fstream>

#include "protocol/QVDaemonProtocol.h"
#include "tests/sdbus/SdBusTest.h"

namespace qv::platform::test {
namespace {

/// Programs that know D-Bus and nothing of this system, as docs/protocol.md shows them.
class StockClientsTest : public SdBusTest {
 protected:
  struct Ran {
    int status;
    std::string output;
  };
  std::string address() const { return "unix:path=" + directory_ + "/test.service"; }
  static Ran run(const std::string& command) {
    FILE* pipe = ::popen(("timeout 60 " + command + " 2>&1").c_str(), "re");
    std::string output;
    char buffer[4096];
    while (const size_t size = std::fread(buffer, 1, sizeof buffer, pipe)) output.append(buffer, size);
    const int status = ::pclose(pipe);
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, output};
  }
  static bool has(const char* program) { return run("sh -c 'command -v " + std::string(program) + "'").status == 0; }
};

TEST_F(StockClientsTest, BusctlCallsAndIntrospects) {
  if (!has("busctl")) GTEST_SKIP() << "no busctl here";
  delegate_.object->serve = echo();
  listen();
  const std::string where = " --address=" + address() + " ";
  const std::string target = " com.tarnwick.quorveld /com/tarnwick/quorveld com.tarnwick.quorveld.Test ";
  EXPECT_EQ(run("busctl" + where + "call" + target + "echo v u 7").output, "v u 7\n");
  EXPECT_EQ(run("busctl" + where + "--expect-reply=no call" + target + "notify u 7").status, 0);
  EXPECT_NE(run("busctl" + where + "call" + target + "echo s text").status, 0);
  const Ran xml = run("busctl" + where + "--xml-interface introspect com.tarnwick.quorveld /com/tarnwick/quorveld");
  EXPECT_NE(xml.output.find("<arg type=\"ah\" name=\"descriptors\" direction=\"in\"/>"), std::string::npos)
      << xml.output;
  EXPECT_NE(xml.output.find("org.freedesktop.DBus.Method.NoReply"), std::string::npos);
}

TEST_F(StockClientsTest, GdbusCalls) {
  if (!has("gdbus")) GTEST_SKIP() << "no gdbus here";
  delegate_.object->serve = echo();
  listen();
  EXPECT_EQ(run("gdbus call --address " + address() +
                " --dest com.tarnwick.quorveld --object-path /com/tarnwick/quorveld "
                "--method com.tarnwick.quorveld.Test.echo '<\"text\">'")
                .output,
            "(<'text'>,)\n");
}

TEST_F(StockClientsTest, APythonClientIsServedAndCalledBack) {
  if (run("/usr/bin/python3 -c 'import dbus, gi'").status != 0) GTEST_SKIP() << "no python3-dbus here";
  delegate_.object->serve = [](const Call& served) {
    served.connection->call("notify", {Value(uint32_t{9})}, {}, {});
    served.reply(served.arguments);
  };
  listen();
  const std::string script = directory_ + "/client.py";
  std::ofstream(script) << R"(
import sys, os, dbus, dbus.connection, dbus.service
from dbus.mainloop.glib import DBusGMainLoop
from gi.repository import GLib
DBusGMainLoop(set_as_default=True)
name, path = 'com.tarnwick.quorveld.Test', '/com/tarnwick/quorveld'
loop = GLib.MainLoop()
class Client(dbus.service.Object):
    @dbus.service.method(name, in_signature='u')
    def notify(self, number):
        print('notified', int(number))
        loop.quit()
connection = dbus.connection.Connection(sys.argv[1])
client = Client(connection, path)
def echo(value):
    return connection.call_blocking(None, path, name, 'echo', 'v', (value,))
echo('first')  # the library knows after one answer that descriptors may be sent
read, write = os.pipe()
os.write(write, b'through')
back = echo(dbus.types.UnixFd(read))
print(os.read(back.take(), 7).decode())
loop.run()
)";
  const Ran ran = run("/usr/bin/python3 " + script + " " + address());
  EXPECT_NE(ran.output.find("through\n"), std::string::npos) << ran.output;
  EXPECT_NE(ran.output.find("notified 9\n"), std::string::npos) << ran.output;
}

TEST_F(StockClientsTest, TheProtocolOfTheDaemonIsDescribedWithItsNames) {
  if (!has("busctl")) GTEST_SKIP() << "no busctl here";
  class Delegate final : public IPCListenerDelegate {
   public:
    bool listenerShouldAcceptNewConnection(IPCListener&, const std::shared_ptr<IPCConnection>& made) override {
      made->setExportedInterface(daemonProtocol(), std::make_shared<FakeObject>());
      made->resume();
      connection = made;
      return true;
    }
    std::shared_ptr<IPCConnection> connection;
  } delegate;
  listener_ = server_->createListener("test.service");
  listener_->setDelegate(&delegate, *queue_);
  ASSERT_FALSE(listener_->resume());
  const Ran xml =
      run("busctl --address=" + address() + " --xml-interface introspect com.tarnwick.quorveld /com/tarnwick/quorveld");
  for (const IPCOperation& operation : daemonProtocol().operations) {
    EXPECT_NE(xml.output.find("<method name=\"" + operation.member + "\">"), std::string::npos) << operation.member;
  }
  EXPECT_NE(xml.output.find("name=\"listenerEndpoint\" direction=\"in\""), std::string::npos) << xml.output;
  listener_.reset();
  queue_->sync([] {});
  delegate.connection.reset();
}

}  // namespace
}  // namespace qv::platform::test
