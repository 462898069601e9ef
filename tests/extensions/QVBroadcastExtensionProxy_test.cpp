#include "extensions/QVBroadcastExtensionProxy.h"

#include "extensions/QVBroadcastProtocols.h"
#include "platform/SharedFrameLease.h"
#include "support/QuorvelErrors.h"
#include "tests/fakes/FakeDevice.h"

namespace qv {
namespace {

using Kind = BroadcastPayload::Kind;
using platform::Value;

class ProxyTest : public testing::Test {
 protected:
  ProxyTest() { watch(); }
  ~ProxyTest() override {
    if (proxy_) proxy_->invalidateConnection();
    device_.run();
  }
  void watch() {
    proxy_->setServiceInfoHandler([this](const auto& info) { told_ += "info" + std::to_string(info.size()) + " "; });
    proxy_->setBroadcastURLHandler([this](const auto& url) { told_ += url.absoluteString() + " "; });
    proxy_->setErrorHandler([this](const auto& error) { told_ += "error" + std::to_string(error.code) + " "; });
  }
  void establish() {
    proxy_->establishConnectionWithHandler(
        [this](const auto& error) { told_ += error ? "failed" + std::to_string(error->code) + " " : "ready "; });
    device_.run();
  }
  void connect() {
    establish();
    extension_.connect();
    device_.run();
    ping();
    told_.clear();
  }
  void ping() {
    extension_.call("ping");
    device_.run();
  }
  /// `number` tells payloads apart.
  void send(Kind kind, int64_t number, double seconds = 0) {
    BroadcastPayload payload;
    payload.kind = kind;
    payload.entries = {{"number", Value(number)}};
    payload.duration = seconds;
    if (kind == Kind::Video) payload.frame.setSharedFrame(fakes::makeFrame(number)->image()->sharedFrame());
    proxy_->processPayload(std::move(payload), [this] { ++completed_; });
  }
  std::vector<int64_t> received() {
    std::vector<int64_t> numbers;
    for (const auto& payload : extension_.received) numbers.push_back(valueForKey(payload, "number").asInteger());
    return numbers;
  }
  std::string told() { return std::exchange(told_, {}); }

  fakes::FakeDevice device_;
  fakes::FakeBroadcastExtension extension_{device_.ipc, device_.extensions, device_.executor};
  const platform::ExtensionRecordRef record_ = device_.extensions.install("a.b.upload", broadcastpoint::kUpload);
  std::shared_ptr<QVBroadcastExtensionProxy> proxy_ = QVBroadcastExtensionProxy::withBroadcastUploadExtension(record_);
  std::string told_;
  int completed_ = 0;
};

TEST_F(ProxyTest, IsReadyAtEachPingAndServesTheExtensionsCalls) {
  establish();
  EXPECT_EQ(told(), "");
  extension_.connect();
  device_.run();
  EXPECT_EQ(told(), "") << "connected is not ready";
  ping();
  ping();
  extension_.call("updateServiceInfo", {Value(platform::Dictionary{{"viewers", Value(int64_t{3})}})});
  extension_.call("updateBroadcastURL", {Value("https://live")});
  extension_.call("finishBroadcastWithError", {Value(platform::encodeError(platform::Error{"d", 7, {}}))});
  device_.run();
  device_.timers.advance(kExtensionPatience);
  device_.run();
  EXPECT_EQ(told(), "ready ready info1 https://live error7 ");

  proxy_->invalidateConnection();
  device_.run();
  EXPECT_EQ(told(), "") << "an end by this side is no loss";
  EXPECT_EQ(device_.extensions.killed, std::vector<std::string>{"a.b.upload"});
}

TEST_F(ProxyTest, EveryHandshakeThatFailsEndsInOneError) {
  establish();
  extension_.connect();
  device_.timers.advance(kExtensionPatience);
  device_.run();
  EXPECT_EQ(told(), "failed-5808 ") << "it never pinged";
  ping();
  EXPECT_EQ(told(), "") << "too late";

  const auto failsWith = [&] {
    proxy_ = QVBroadcastExtensionProxy::withBroadcastUploadExtension(record_);
    establish();
    device_.timers.advance(kExtensionPatience);
    device_.run();
    return told();
  };
  device_.extensions.vendor = nullptr;
  EXPECT_EQ(failsWith(), "failed-5808 ") << "no auxiliary connection to hand the endpoint over";
  device_.extensions.launchError = platform::Error{"d", 9, {}};
  EXPECT_EQ(failsWith(), "failed9 ");
}

TEST_F(ProxyTest, ASlowExtensionLosesTheOldestFramesFirstAndNoAction) {
  send(Kind::Control, 0);
  connect();
  extension_.answers = false;
  for (int64_t i = 1; i <= 4; ++i) send(Kind::Control, i);  // in flight
  for (int64_t i = 0; i < 12; ++i) {
    send(Kind::Video, 100 + i);
    send(Kind::AppAudio, 200 + i, 0.1);
  }
  send(Kind::Control, 5);
  device_.run();
  EXPECT_EQ(received(), (std::vector<int64_t>{1, 2, 3, 4})) << "what came before the connection is lost";
  EXPECT_EQ(platform::outstandingSharedFrameLeases(), 0u) << "no lease for what only waits";

  extension_.answers = true;
  for (const auto& reply : std::exchange(extension_.unanswered, {})) reply({});
  device_.run();
  const auto all = received();
  EXPECT_EQ(all.size(), 4u + 8u + 12u + 1u);
  EXPECT_EQ(std::count_if(all.begin(), all.end(), [](int64_t n) { return n >= 100 && n < 104; }), 0);
  EXPECT_EQ(all.back(), 5);
  EXPECT_EQ(completed_, 25);
  EXPECT_TRUE(device_.log.countContaining("4 frames and 0 runs of sound dropped") > 0);

  BroadcastPayloadQueue queue;
  for (int i = 0; i < 30; ++i) queue.push({{Kind::AppAudio, {}, {}, 0.1}, nullptr});
  for (int i = 0; i < 5; ++i) queue.push({{Kind::Microphone, {}, {}, 0.1}, nullptr});
  EXPECT_NEAR(static_cast<double>(queue.droppedAudio()), 10, 1) << "2 s of each are kept";
}

TEST_F(ProxyTest, ALossIsToldOnceAndAFloodIsNotPassedOn) {
  connect();
  extension_.answers = false;
  send(Kind::Control, 1);
  send(Kind::Control, 2);
  for (int i = 0; i < 500; ++i) extension_.call("updateBroadcastURL", {Value("u")});
  device_.run();
  const std::string passedOn = told();
  EXPECT_LE(passedOn.size(), 2u * QVBroadcastExtensionProxy::kMaximumCallsPerSecond);
  extension_.connection->invalidate();
  device_.run();
  send(Kind::Control, 3);
  device_.run();
  EXPECT_EQ(told(), "error-5808 ");
  EXPECT_EQ(completed_, 0);
}

TEST_F(ProxyTest, ConnectsToAnExtensionThatListensAlready) {
  struct Owner final : platform::IPCListenerDelegate {
    bool listenerShouldAcceptNewConnection(platform::IPCListener&,
                                           const std::shared_ptr<platform::IPCConnection>& accepted) override {
      extension.serve(accepted);
      return true;
    }
    explicit Owner(fakes::FakeBroadcastExtension& to) : extension(to) {}
    fakes::FakeBroadcastExtension& extension;
  } owner(extension_);
  platform::SerialQueue queue("extension", device_.executor);
  auto listener = device_.ipc.createAnonymousListener();
  listener->setDelegate(&owner, queue);
  EXPECT_EQ(listener->resume(), std::nullopt);
  const auto endpoint = listener->endpoint();
  proxy_ = *QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(endpoint);
  watch();
  send(Kind::Control, 1);
  device_.run();
  EXPECT_EQ(received(), std::vector<int64_t>{1});
  EXPECT_EQ(completed_, 1);
  listener->invalidate();
  EXPECT_FALSE(QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(endpoint)) << "its owner has gone";
}

}  // namespace
}  // namespace qv
