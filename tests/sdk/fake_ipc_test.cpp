#include <gtest/gtest.h>

#include "daemon/client/QVDaemonProtocol.h"
#include "tests/fakes/FakeIPC.h"
#include "tests/fakes/ManualExecutor.h"

namespace qv::fakes {
namespace {

using platform::Array;
using platform::Error;
using platform::IPCArguments;
using platform::IPCConnection;
using platform::Value;

/// A named service that accepts everybody, and one client of it.
class FakeIPCTest : public ::testing::Test, protected platform::IPCListenerDelegate {
 protected:
  FakeIPCTest() {
    listener_->setDelegate(this, queue_);
    EXPECT_FALSE(listener_->resume());
    client_ = connect();
  }
  ~FakeIPCTest() override {
    client_.reset();
    server_.reset();
    executor_.runAll();
  }
  std::shared_ptr<IPCConnection> connect() {
    auto connection = service_.connect(kServiceName);
    EXPECT_TRUE(connection);
    (*connection)->setRemoteInterface(daemonProtocol());
    (*connection)->setInterruptionHandler([this] { events_.push_back("interrupted"); });
    (*connection)->setInvalidationHandler([this] { events_.push_back("invalidated"); });
    (*connection)->resume();
    return *connection;
  }
  bool listenerShouldAcceptNewConnection(platform::IPCListener&,
                                         const std::shared_ptr<IPCConnection>& connection) override {
    connection->setExportedInterface(daemonProtocol(), object_);
    connection->setInvalidationHandler([this] { events_.push_back("server invalidated"); });
    connection->resume();
    server_ = connection;
    return true;
  }
  void call(const char* member, IPCArguments arguments) {
    client_->call(
        member, std::move(arguments), [this](const IPCArguments&) { events_.push_back("completed"); },
        [this](const Error& error) { events_.push_back("failed " + std::to_string(error.code)); });
  }

  ManualExecutor executor_;
  FakeIPCService service_{executor_};
  platform::SerialQueue queue_{"test", executor_};
  std::shared_ptr<RecordingExportedObject> object_ = std::make_shared<RecordingExportedObject>();
  std::unique_ptr<platform::IPCListener> listener_ = service_.createListener(kServiceName);
  std::shared_ptr<IPCConnection> client_, server_;
  std::vector<std::string> events_;
};

TEST_F(FakeIPCTest, CallsCarryTypedArgumentsAndEndOnce) {
  call("stopRecordingWithStartClipDuration", {1.5, 2.5});
  executor_.runAll();
  auto received = object_->takeCall();
  EXPECT_EQ(received.arguments, (IPCArguments{1.5, 2.5}));
  received.reply({"file:///a.mp4", Value()});
  received.reply.fail("late", "");
  executor_.runAll();
  EXPECT_EQ(events_, std::vector<std::string>{"completed"});
}

TEST_F(FakeIPCTest, RefusesWhatTheWireCouldNotCarry) {
  call("stopRecordingWithStartClipDuration", {1.5, "two"});
  call("noSuchMember", {});
  call("stopRecordingWithHandler", {});
  executor_.runAll();
  object_->takeCall();  // dropped unanswered
  executor_.runAll();
  EXPECT_EQ(events_, (std::vector<std::string>{"failed 4", "failed 3", "failed 5"}));
}

TEST_F(FakeIPCTest, ALossIsToldOnceAndEndsCalls) {
  call("stopRecordingWithHandler", {});
  executor_.runAll();
  server_->invalidate();
  executor_.runAll();
  client_->invalidate();
  call("stopRecordingWithHandler", {});
  executor_.runAll();
  EXPECT_EQ(events_, (std::vector<std::string>{"server invalidated", "failed 1", "interrupted", "failed 1"}));
}

TEST_F(FakeIPCTest, HeldMessagesArriveAsTheTestSays) {
  service_.mail().hold();
  call("pauseRecording", {});
  call("setMicrophoneEnabled", {true});
  executor_.runAll();
  EXPECT_EQ(object_->callCount(), 0u);
  service_.mail().deliverNext();
  executor_.runAll();
  EXPECT_EQ(object_->members(), std::vector<std::string>{"pauseRecording"});
  service_.mail().release();
  executor_.runAll();
  EXPECT_EQ(object_->callCount(), 2u);
}

TEST_F(FakeIPCTest, AnEndpointConnectsToItsListener) {
  auto anonymous = service_.createAnonymousListener();
  anonymous->setDelegate(this, queue_);
  EXPECT_FALSE(anonymous->resume());
  EXPECT_TRUE(service_.connect(anonymous->endpoint()));
  anonymous->invalidate();
  EXPECT_FALSE(service_.connect(anonymous->endpoint()));
  executor_.runAll();
}

TEST(ValueForSignature, ConvertsIntegersAndRefusesOtherKinds) {
  EXPECT_EQ(valueForSignature(Value(int64_t{7}), "u"), Value(uint32_t{7}));
  EXPECT_EQ(valueForSignature(Value(-1), "u"), std::nullopt);
  EXPECT_EQ(valueForSignature(Value("7"), "u"), std::nullopt);
  EXPECT_EQ(valueForSignature(Value(Array{1.0, 2.0}), "(dd)"), Value(Array{1.0, 2.0}));
  EXPECT_EQ(valueForSignature(Value(Array{1.0}), "(dd)"), std::nullopt);
  EXPECT_EQ(valueForSignature(Value(Array{1, 2}), "au"), Value(Array{uint32_t{1}, uint32_t{2}}));
  EXPECT_EQ(valueForSignature(Value(platform::URL("file:///x")), "s"), Value("file:///x"));
}

}  // namespace
}  // namespace qv::fakes
