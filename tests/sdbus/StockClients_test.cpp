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
  EXPECT_NE(xml.find("<arg type=\"ah\" name=\"descriptors\" direction=\"in\"/>"), std::string::npos) << xml;
  EXPECT_NE(xml.find("org.freedesktop.DBus.Method.NoReply"), std::string::npos);
}

}  // namespace
}  // namespace qv::platform::test
