#include "extensions/QVBroadcastExtensionProxy.h"

#include "platform/threads/SharedFrameLease.h"
#include "protocol/QVBroadcastProtocols.h"
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
    proxy_->processPayload(std::move(payload), [this](PayloadOutcome outcome) {
      ++(outcome == PayloadOutcome::Answered ? completed_ : givenUp_);
    });
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
  std::shared_ptr<QVBroadcastExtensionProxy> proxy_ =
      QVBroadcastExtensionProxy::withBroadcastUploadExtension(device_.platform, record_);
  std::string told_;
  int completed_ = 0, givenUp_ = 0;
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
  extension_.call("finishBroadcastWithError", {Value(platform::encodeError(platform::Error{"d", 8, {}}))});
  extension_.connection->invalidate();
  device_.run();
  EXPECT_EQ(told(), "") << "its end is told once";

  const auto held = std::make_shared<int>(1);
  proxy_->setServiceInfoHandler([held](const auto&) {});
  proxy_->setBroadcastURLHandler([held](const auto&) {});
  proxy_->setErrorHandler([held](const auto&) {});
  device_.run();
  proxy_->invalidateConnection();
  EXPECT_EQ(held.use_count(), 1) << "the handlers are let go";
  device_.run();
  EXPECT_EQ(told(), "") << "an end by this side is no loss";
  EXPECT_EQ(device_.extensions.killed, std::vector<std::string>{"a.b.upload"});
  establish();
  EXPECT_EQ(told(), "failed-5808 ") << "for good";
}

TEST_F(ProxyTest, ANewConnectionReplacesTheFormer) {
  establish();
  const auto given = extension_.vendor->takeCall();
  const platform::ListenerEndpoint endpoint(*given.arguments.at(0).getIf<platform::SharedFileDescriptor>());
  extension_.answers = false;
  extension_.serve(*device_.ipc.connect(endpoint));
  device_.run();
  ping();
  send(Kind::Control, 1);
  device_.run();
  const auto former = extension_.connection;
  extension_.serve(*device_.ipc.connect(endpoint));
  device_.run();
  EXPECT_EQ(std::exchange(givenUp_, 0), 1) << "nobody answers it any more";
  former->call("updateBroadcastURL", {Value("stale")}, nullptr, nullptr);
  extension_.unanswered.clear();
  extension_.answers = true;
  send(Kind::Control, 2);
  device_.run();
  former->invalidate();
  device_.run();
  EXPECT_EQ(told(), "ready ");
  EXPECT_EQ(received(), (std::vector<int64_t>{1, 2}));
  EXPECT_EQ(completed_, 1);
  EXPECT_EQ(givenUp_, 0);
  proxy_->invalidateConnection();
  EXPECT_FALSE(device_.ipc.connect(endpoint)) << "it does not listen any more";
}

TEST_F(ProxyTest, AnExtensionThatEndsBeforeItsPingAnswersTheWaiterAtOnce) {
  const std::vector<std::pair<const char*, std::function<void()>>> ends = {
      {"error7 ",
       [&] {
         extension_.call("finishBroadcastWithError", {Value(platform::encodeError(platform::Error{"d", 7, {}}))});
       }},
      {"error-5808 ", [&] { extension_.connection->invalidate(); }},
      {"error104 ",
       [&] {
         device_.extensions.complete(device_.extensions.requests.size() - 1, platform::Error::posix(104, "died"));
       }},
      {"error-5808 ",
       [&] {
         device_.extensions.complete(device_.extensions.requests.size() - 1, std::vector<platform::ExtensionItem>{});
       }},
      {"error-5808 ", [&] { proxy_->invalidateConnection(); }},
      {"error-5808 ", [&] { proxy_.reset(); }},
  };
  for (const auto& [expected, end] : ends) {
    proxy_ = QVBroadcastExtensionProxy::withBroadcastUploadExtension(device_.platform, record_);
    watch();
    proxy_->establishConnectionWithHandler(
        [this](const auto& error) { told_ += error ? "error" + std::to_string(error->code) + " " : "ready "; });
    device_.run();
    extension_.connect();
    device_.run();
    told_.clear();
    end();
    device_.run();
    EXPECT_EQ(told(), expected) << "and no error handler";
    extension_.call("ping");
    extension_.connection->invalidate();
    device_.run();
    device_.timers.advance(kExtensionPatience);
    device_.run();
    EXPECT_EQ(told(), "") << "once";
  }
}

TEST_F(ProxyTest, EveryPayloadGetsItsOutcomeOnce) {
  send(Kind::Control, 1);
  EXPECT_EQ(std::exchange(givenUp_, 0), 1) << "not connected";
  connect();
  extension_.answers = false;
  for (int64_t i = 0; i < 7; ++i) send(Kind::Control, i);  // four of them in flight
  device_.run();
  std::exchange(extension_.unanswered, {}).front()({});
  device_.run();
  EXPECT_EQ(completed_, 1);
  proxy_->invalidateConnection();
  EXPECT_EQ(completed_ + givenUp_, 7) << "when it returns";
  device_.run();
  EXPECT_EQ(completed_, 1);
  EXPECT_EQ(std::exchange(givenUp_, 0), 6);
  EXPECT_EQ(device_.extensions.killed.size(), 1u);

  proxy_ = QVBroadcastExtensionProxy::withBroadcastUploadExtension(device_.platform, record_);
  connect();
  for (int64_t i = 0; i < 7; ++i) send(Kind::Control, i);
  device_.run();
  extension_.connection->invalidate();
  device_.run();
  EXPECT_EQ(givenUp_, 7) << "lost";
  extension_.unanswered.clear();
}

TEST_F(ProxyTest, LinksToOneExtensionDoNotMeet) {
  connect();
  const auto second = QVBroadcastExtensionProxy::withBroadcastUploadExtension(device_.platform, record_);
  second->establishConnectionWithHandler([this](const auto& error) { told_ += error ? "failed " : "second ready "; });
  device_.run();
  const auto first = std::exchange(proxy_, nullptr);
  first->invalidateConnection();
  EXPECT_EQ(device_.extensions.killed.size(), 1u) << "its own process";
  extension_.connect();
  device_.run();
  ping();
  EXPECT_EQ(told(), "second ready ");
  second->invalidateConnection();
  EXPECT_EQ(device_.extensions.killed.size(), 2u);
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
    proxy_ = QVBroadcastExtensionProxy::withBroadcastUploadExtension(device_.platform, record_);
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
  connect();
  extension_.answers = false;
  for (int64_t i = 1; i <= 4; ++i) send(Kind::Control, i);  // in flight
  for (int64_t i = 0; i < 12; ++i) {
    send(Kind::Video, 100 + i);
    send(Kind::AppAudio, 200 + i, 0.1);
  }
  send(Kind::Control, 5);
  device_.run();
  EXPECT_EQ(received(), (std::vector<int64_t>{1, 2, 3, 4}));
  EXPECT_EQ(platform::outstandingSharedFrameLeases(), 0u) << "no lease for what only waits";

  extension_.answers = true;
  for (const auto& reply : std::exchange(extension_.unanswered, {})) reply({});
  device_.run();
  const auto all = received();
  EXPECT_EQ(all.size(), 4u + 8u + 12u + 1u);
  EXPECT_EQ(std::count_if(all.begin(), all.end(), [](int64_t n) { return n >= 100 && n < 104; }), 0);
  EXPECT_EQ(all.back(), 5);
  EXPECT_EQ(completed_, 25);
  EXPECT_EQ(givenUp_, 4);

  BroadcastPayloadQueue queue;
  size_t dropped = 0;
  for (int i = 0; i < 30; ++i) dropped += queue.push({{Kind::AppAudio, {}, {}, 0.125}, nullptr}).size();
  for (int i = 0; i < 16; ++i) dropped += queue.push({{Kind::Microphone, {}, {}, 0.125}, nullptr}).size();
  EXPECT_EQ(queue.droppedAudio(), 14u) << "2 s of each are kept";
  for (int i = 0; i < 10; ++i) dropped += queue.push({{Kind::Video, {}, {}, 0}, nullptr}).size();
  EXPECT_EQ(queue.droppedFrames(), 2u);
  EXPECT_EQ(dropped, 16u);
}

TEST_F(ProxyTest, ALossIsToldOnceAndAFloodIsNotPassedOn) {
  connect();
  extension_.answers = false;
  send(Kind::Control, 1);
  send(Kind::Control, 2);
  for (int second = 0; second < 2; ++second) {
    device_.clock.advance(std::chrono::seconds(1));
    for (int i = 0; i < 500; ++i) extension_.call("updateBroadcastURL", {Value("u")});
    device_.run();
    EXPECT_EQ(told().size(), 2u * QVBroadcastExtensionProxy::kMaximumCallsPerSecond);
  }
  extension_.connection->invalidate();
  device_.run();
  send(Kind::Control, 3);
  device_.run();
  EXPECT_EQ(told(), "error-5808 ");
  EXPECT_EQ(completed_, 0);
  EXPECT_EQ(givenUp_, 3);
}

/// A picture that stands still is sent again every 0.45 s.
TEST_F(ProxyTest, AReceiverThatKeepsEveryLeaseDoesNotUseUpDescriptors) {
  const size_t before = platform::outstandingSharedFrameLeases();
  const QVSharedFrameObject picture(fakes::makeFrame(1)->image()->sharedFrame());
  std::vector<Value> kept;
  for (int i = 0; i < 100; ++i) kept.push_back(picture.encodeForIPC());
  EXPECT_LE(platform::outstandingSharedFrameLeases() - before, platform::kMaximumSharedFrameLeases);
  EXPECT_FALSE(kept.back().isNone());
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
  proxy_ = *QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(device_.platform, endpoint);
  device_.run();
  extension_.call("updateBroadcastURL", {Value("early")});
  device_.run();
  watch();
  device_.run();
  EXPECT_EQ(told(), "early ") << "what came before somebody listened";
  send(Kind::Control, 1);
  device_.run();
  EXPECT_EQ(received(), std::vector<int64_t>{1});
  EXPECT_EQ(completed_, 1);
  listener->invalidate();
  EXPECT_FALSE(QVBroadcastExtensionProxy::withBroadcastUploadListenerEndpoint(device_.platform, endpoint))
      << "its owner has gone";
}

}  // namespace
}  // namespace qv
