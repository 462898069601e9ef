#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <variant>
#include <vector>

#include "platform/sdbus/SdBusIPC.h"
#include "tests/fakes/AcceptingDelegate.h"
#include "tests/kit/Events.h"
#include "tests/kit/ScratchFolder.h"
#include "tests/sdbus/TestInterface.h"

namespace qv::platform::test {

using fakes::RecordingExportedObject;
using kit::Events;
using kit::kNever;
using Call = RecordingExportedObject::ReceivedCall;

/// A daemon's service object and a client's, talking over a socket in a directory of the test's own.
class SdBusTest : public ::testing::Test {
 protected:
  explicit SdBusTest(SdBusIPCOptions options = {}) {
    options.runtimeDirectory = directory_;
    server_ = std::make_unique<SdBusIPCService>(resolver(), options);
    options.trustsPeers = true;
    client_ = std::make_unique<SdBusIPCService>(IPCPeerResolver(), options);
  }
  ~SdBusTest() override {
    listener_.reset();
    client_.reset();
    server_.reset();
    // Whatever is still queued for the fakes runs while they live.
    queue_->sync([] {});
  }

  static IPCPeerResolver resolver() {
    return [](IPCPeer& peer) {
      peer.bundleIdentifier = "com.example.pid" + std::to_string(peer.processIdentifier);
      peer.entitlements["com.example.allowed"] = Value(true);
    };
  }

  void listen() {
    listener_ = server_->createListener("test.service");
    listener_->setDelegate(&delegate_, *queue_);
    const auto error = listener_->resume();
    ASSERT_FALSE(error) << error->description();
  }

  /// A client's connection, configured but not resumed.
  std::shared_ptr<IPCConnection> makeClient() {
    auto connection = client_->connect("test.service");
    EXPECT_TRUE(connection.hasValue()) << connection.error().description();
    configure(*connection.value());
    return connection.value();
  }
  void configure(IPCConnection& connection) {
    connection.setExportedInterface(testInterface(), clientObject_);
    connection.setRemoteInterface(testInterface());
    connection.setInvalidationHandler([this] { clientEnded_.add("invalidated"); });
    connection.setInterruptionHandler([this] { clientEnded_.add("interrupted"); });
    connection.setTargetQueue(*queue_);
  }
  std::shared_ptr<IPCConnection> connectClient() {
    auto connection = makeClient();
    connection->resume();
    return connection;
  }

  /// Calls and waits for the end; a failure as an Error.
  using Outcome = std::variant<std::monostate, IPCArguments, Error>;
  Outcome call(IPCConnection& connection, std::string_view member, IPCArguments arguments) {
    auto outcomes = std::make_shared<Events<Outcome>>();
    connection.call(
        member, std::move(arguments), [outcomes](const IPCArguments& values) { outcomes->add(values); },
        [outcomes](const Error& error) { outcomes->add(error); });
    Outcome outcome = outcomes->next();
    EXPECT_TRUE(outcomes->isEmpty()) << "a call ended twice";
    return outcome;
  }
  static IPCArguments valuesOf(const Outcome& outcome) {
    if (const auto* error = std::get_if<Error>(&outcome)) ADD_FAILURE() << error->description();
    const auto* values = std::get_if<IPCArguments>(&outcome);
    return values ? *values : IPCArguments();
  }
  static int64_t codeOf(const Outcome& outcome) {
    const auto* error = std::get_if<Error>(&outcome);
    return error ? error->code : 0;
  }
  /// Where the code of a call's failure goes.
  static std::function<void(const Error&)> into(Events<int64_t>& failures) {
    return [&failures](const Error& error) { failures.add(error.code); };
  }
  static void echo(const Call& served) { served.reply(served.arguments); }
  /// A client of a service that echoes.
  std::shared_ptr<IPCConnection> connectEcho() {
    delegate_.object->answer = echo;
    listen();
    return connectClient();
  }

  const kit::ScratchFolder folder_;
  const std::string directory_ = folder_.path();
  const std::unique_ptr<SerialQueue> queue_ = std::make_unique<SerialQueue>("test");
  fakes::AcceptingDelegate delegate_{testInterface(), testInterface()};
  const std::shared_ptr<RecordingExportedObject> clientObject_ = std::make_shared<RecordingExportedObject>();
  Events<std::string> clientEnded_;
  std::unique_ptr<SdBusIPCService> server_;
  std::unique_ptr<SdBusIPCService> client_;
  std::unique_ptr<IPCListener> listener_;
};

constexpr int64_t code(IPCErrorCode value) { return static_cast<int64_t>(value); }

}  // namespace qv::platform::test
