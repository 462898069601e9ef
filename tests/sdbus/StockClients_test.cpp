#include "tests/kit/Process.h"
#include "tests/sdbus/SdBusTest.h"

namespace qv::platform::test {
namespace {

/// A program that knows D-Bus and nothing of this system, as docs/protocol.md shows it. (Another library is that of the
/// client in tests/e2e.)
using StockClientsTest = SdBusTest;

TEST_F(StockClientsTest, BusctlCallsAndIntrospects) {
  if (!kit::isInstalled("busctl")) GTEST_SKIP() << "no busctl here";
  delegate_.object->answer = echo;
  listen();
  const auto run = [this](std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), "--address=unix:path=" + directory_ + "/test.service");
    kit::Process busctl("busctl", arguments);
    const std::string output = busctl.read(1 << 20);
    return std::pair(busctl.wait(), output);
  };
  const std::string name = "com.tarnwick.quorveld", path = "/com/tarnwick/quorveld", interface = name + ".Test";
  EXPECT_EQ(run({"call", name, path, interface, "echo", "v", "u", "7"}).second, "v u 7\n");
  EXPECT_EQ(run({"--expect-reply=no", "call", name, path, interface, "notify", "u", "7"}).first, 0);
  EXPECT_NE(run({"call", name, path, interface, "echo", "s", "text"}).first, 0);
  const std::string xml = run({"--xml-interface", "introspect", name, path}).second;
  for (const char* part : {R"(  <method name="echo">
   <arg type="v" name="value" direction="in"/>
   <arg type="v" name="value" direction="out"/>
  </method>)",
                           R"(  <method name="notify">
   <arg type="u" name="number" direction="in"/>
   <annotation name="org.freedesktop.DBus.Method.NoReply" value="true"/>
  </method>)"}) {
    EXPECT_NE(xml.find(part), std::string::npos) << xml;
  }
  const auto bus = [&](std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), {"call", name, "/org/freedesktop/DBus", "org.freedesktop.DBus"});
    return run(arguments).second;
  };
  EXPECT_EQ(bus({"GetNameOwner", "s", "a.b"}), "s \"a.b\"\n");
  EXPECT_EQ(bus({"NameHasOwner", "s", "a.b"}), "b true\n");
  EXPECT_EQ(bus({"StartServiceByName", "su", "a.b", "0"}), "u 2\n") << "it runs already";
  EXPECT_EQ(run({"call", name, "/org/freedesktop/DBus", "org.freedesktop.DBus", "AddMatch", "s", "x"}).first, 0);
}

}  // namespace
}  // namespace qv::platform::test
