#include "session/QVClientProxy.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/sdk/RecorderFixture.h"

namespace qv::client {
namespace {

class ClientProxy : public RecorderFixture {};

TEST_F(ClientProxy, FailuresOfSamplesAreToldAsTheirNumberDoubles) {
  startRecording();
  const auto connection = daemonEnd_;
  const platform::Platform platform;
  const QVBundleTexts texts(platform);
  const QuorvelErrors errors(texts);
  QVClientProxy proxy(errors, "com.example.game", connection);
  killDaemon();
  const fakes::LogRecorder log;
  for (int i = 0; i < 1000; ++i) proxy.captureHandlerWithAudioSample({});
  for (int i = 0; i < 3; ++i) proxy.updateBroadcastURL(platform::URL("https://x"));
  run();
  const std::string sound = "QVClientProxy:captureHandlerWithAudioSample: error getting remote proxy: ";
  EXPECT_EQ(log.count(sound + "1"), 1u);
  EXPECT_EQ(log.countContaining(sound), 10u) << "1, 2, 4 ... 512";
  EXPECT_EQ(log.count(sound + "1 (512 times)"), 1u);
  EXPECT_EQ(log.count("QVClientProxy:updateBroadcastURL: error getting remote proxy: 1"), 3u);
  QVClientProxy(errors, "com.example.game", nullptr).updateBroadcastURL(platform::URL("https://x"));
  EXPECT_EQ(log.countContaining("updateBroadcastURL: error getting remote proxy"), 3u) << "its application has gone";
}

}  // namespace
}  // namespace qv::client
