#pragma once

#include <cmath>

#include "extensions/AnswerDeadline.h"
#include "protocol/QVBroadcastProtocols.h"
#include "tests/daemon/DaemonTest.h"

namespace qv {

/// Applications that broadcast, and an extension that does only what the test makes it do.
class BroadcastFixture : public DaemonTest {
 protected:
  ~BroadcastFixture() override {
    // What still waits for an extension's answer gives up.
    device_.timers.advance(std::chrono::minutes(5));
    device_.run();
  }
  static constexpr const char* kSamples = "QVBroadcastProcessModeSampleBuffer";

  void install(const TestClient& client, const std::string& mode = {}) {
    device_.extensions.install(client.bundleID() + ".upload", broadcastpoint::kUpload, mode);
  }
  static platform::Data clipsOf(double seconds) { return QVBroadcastConfiguration{seconds, {}}.encode(); }
  /// The code of the answer.
  static int64_t setUp(TestClient& client, const platform::Data& configuration = clipsOf(5),
                       const std::string& extension = "com.example.game.setup", const std::string& host = {}) {
    using platform::Value;
    return client
        .request("setupBroadcastWithHostBundleID",
                 {Value(host.empty() ? client.bundleID() : host), Value(extension), Value(configuration),
                  Value(platform::Dictionary{{"key", Value("stream")}})})
        .value()
        .code();
  }
  /// A start of a broadcast of samples whose extension is ready.
  TestClient::Slot startSamples(TestClient& client, bool system = false) {
    auto started = client.postStart({.broadcast = true, .system = system});
    device_.run();
    extension_.connect();
    device_.run();
    extension_.call("ping");
    device_.run();
    return started;
  }
  /// A tenth of a second of sound.
  void sound(int64_t tenths) {
    ASSERT_TRUE(device_.tap.fill(4410, tenths * kSecond / 10));
    device_.run();
  }
  /// The same to the microphone.
  void speak(double tenths) {
    DaemonTest::speak(std::llround(tenths * kSecond / 10), 4410);
    device_.run();
  }
  void frame(int64_t tenths) { sendFrame(tenths * kSecond / 10); }
  /// Pictures, and their sound `lag` tenths of a second later.
  void play(int64_t from, int64_t to, int64_t lag = 0) {
    for (int64_t tenth = from; tenth < to; ++tenth) {
      frame(tenth);
      if (tenth - lag >= from) sound(tenth - lag);
    }
  }
  /// Of an answer to a clip.
  static platform::ExtensionItem item(const char* title, platform::Value value) {
    return {title, {{platform::kGenericDataType, std::move(value)}}};
  }

  fakes::FakeBroadcastExtension extension_{device_.ipc, device_.extensions, device_.executor};
};

}  // namespace qv
