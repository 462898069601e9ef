#include <unistd.h>

#include "platform/x11/X11Platform.h"
#include "tests/kit/XServer.h"

namespace qv::platform {
namespace {

using kit::WindowProcess;
using kit::XClient;
using kit::XServer;

using RenderServerTest = kit::XServerTest;

TEST_F(RenderServerTest, NamesTheProcessThatMadeTheWindow) {
  auto platform = X11Platform::connect(display(), {});
  ASSERT_TRUE(platform);
  auto& renderServer = platform.value()->renderServer();
  WindowProcess other(display());
  XClient own(display());
  const auto window = own.show({});
  EXPECT_EQ(renderServer.ownerOfContext(window), ::getpid());
  EXPECT_EQ(renderServer.ownerOfContext(other.window()), other.pid());
  EXPECT_EQ(renderServer.ownerOfContext(0), std::nullopt);
  EXPECT_EQ(renderServer.ownerOfContext(0xdeadbeef), std::nullopt);
  EXPECT_EQ(renderServer.ownerOfContext(own.root()), std::nullopt);
  EXPECT_EQ(renderServer.ownerOfContext(window + 77), std::nullopt) << "an unused id of a living client";
  own.destroy(window);
  EXPECT_EQ(renderServer.ownerOfContext(window), std::nullopt);
  other.kill();
  // The dead client's range of ids goes to the next client: its windows are not the old ones.
  XClient successor(display());
  successor.sync();
  EXPECT_EQ(renderServer.ownerOfContext(other.window()), std::nullopt);
}

TEST_F(RenderServerTest, ConnectsAnewAfterTheServerCameBack) {
  EXPECT_FALSE(X11Platform::connect(":4242", {}));
  XServer mortal;
  auto platform = X11Platform::connect(mortal.display(), {});
  ASSERT_TRUE(platform);
  auto& renderServer = platform.value()->renderServer();
  mortal.kill();
  EXPECT_EQ(renderServer.ownerOfContext(0x200001), std::nullopt);
  kit::Process again(
      "Xvfb", {mortal.display(), "-displayfd", "1", "-screen", "0", "640x480x24", "-nolisten", "tcp", "-noreset"});
  EXPECT_EQ(":" + again.readLine(), mortal.display());
  XClient client(mortal.display());
  const auto window = client.show({});
  EXPECT_EQ(renderServer.ownerOfContext(window), ::getpid());
}

}  // namespace
}  // namespace qv::platform
