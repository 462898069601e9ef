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
  std::string expected = "<interface name=\"" + interface + "\">\n";
  for (const IPCOperation& operation : testInterface().operations) {
    const auto add = [&](const char* direction, const auto& types, const auto& names) {
      for (size_t i = 0; i < types.size(); ++i) {
        expected += "   <arg type=\"" + types[i] + "\" name=\"" +
                    (i < names.size() ? names[i] : "arg" + std::to_string(i)) + "\" direction=\"" + direction +
                    "\"/>\n";
      }
    };
    expected += "  <method name=\"" + operation.member + "\">\n";
    add("in", operation.arguments, operation.argumentNames);
    add("out", operation.reply.value_or(std::vector<std::string>{}), operation.replyNames);
    if (!operation.reply) expected += "   <annotation name=\"org.freedesktop.DBus.Method.NoReply\" value=\"true\"/>\n";
    expected += "  </method>\n";
  }
  const std::string xml = run({"--xml-interface", "introspect", name, path}).second;
  EXPECT_NE(xml.find(expected + " </interface>"), std::string::npos) << xml << expected;
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
