#pragma once

#include <optional>
#include <string>
#include <vector>

#include "daemon/QVRecordingManager.h"
#include "daemon/client/QVClientProtocol.h"
#include "daemon/client/QVDaemonProtocol.h"
#include "support/QuorvelErrors.h"
#include "tests/fakes/FakeDevice.h"

namespace qv {

inline constexpr int64_t kSecond = 1'000'000'000;

/// What an application sees of the daemon.
class TestClient {
 public:
  TestClient(fakes::FakeDevice& device, std::string bundleID, pid_t pid, platform::Dictionary entitlements = {})
      : device_(device), bundleID_(std::move(bundleID)), pid_(pid) {
    platform::IPCPeer peer;
    peer.processIdentifier = pid;
    if (!bundleID_.empty()) peer.bundleIdentifier = bundleID_;
    peer.entitlements = std::move(entitlements);
    device.ipc.setClientPeer(peer);
    connection_ = *device.ipc.connect(kServiceName);
    connection_->setRemoteInterface(daemonProtocol());
    connection_->setExportedInterface(clientProtocol(), object_);
    // Handlers may come after this object has gone.
    connection_->setInvalidationHandler([seen = seen_] { seen->ended = true; });
    connection_->setInterruptionHandler([seen = seen_] { seen->ended = true; });
    connection_->resume();
    device.run();
  }

  struct Answer {
    platform::IPCArguments values;
    std::optional<platform::Error> failure;  ///< of the call itself
    [[nodiscard]] std::string failureName() const {
      return failure ? valueForKey(failure->userInfo, platform::kIPCRemoteErrorNameKey).asString() : std::string();
    }
    [[nodiscard]] int64_t code(size_t at = 0) const {
      const auto error = platform::decodeError(values.at(at).asDictionary());
      return error ? error->code : 0;
    }
  };
  struct StartOptions {
    std::vector<uint32_t> contexts = {};
    double width = 1280, height = 720;
    bool microphone = false, camera = false, broadcast = false, system = false, capture = false;
  };

  void send(const char* member, platform::IPCArguments arguments = {}) {
    post(member, std::move(arguments));
    device_.run();
  }
  /// Like `send`, but nothing has run yet.
  void post(const char* member, platform::IPCArguments arguments = {}) {
    seen_->answer.reset();
    connection_->call(
        member, std::move(arguments),
        [seen = seen_](const platform::IPCArguments& values) {
          seen->answer = Answer{values, std::nullopt};
        },
        [seen = seen_](const platform::Error& error) {
          seen->answer = Answer{{}, error};
        });
  }
  std::optional<Answer> request(const char* member, platform::IPCArguments arguments = {}) {
    send(member, std::move(arguments));
    return seen_->answer;
  }
  void postStart(const StartOptions& o) {
    using platform::Value;
    platform::Array contexts;
    for (const uint32_t context : o.contexts) contexts.emplace_back(context);
    post("startRecordingWindowLayerContextIDs",
         {Value(contexts), Value(platform::Array{Value(o.width), Value(o.height)}), Value(o.microphone),
          Value(o.camera), Value(o.broadcast), Value(o.system), Value(o.capture), Value(platform::Array{})});
  }
  std::optional<Answer> start(const StartOptions& o) {
    postStart(o);
    device_.run();
    return seen_->answer;
  }
  std::optional<Answer> start() { return start(StartOptions{}); }
  std::optional<Answer> stop() { return request("stopRecordingWithHandler"); }
  platform::Dictionary state() { return request("synchronousGetCurrentState")->values.at(0).asDictionary(); }
  bool isRecording() { return valueForKey(state(), "isRecording").asBool(); }
  void disconnect() {
    leave();
    device_.run();
  }
  void leave() { connection_->invalidate(); }
  /// The codes of the end-of-recording messages so far; 0 for none. Takes them.
  std::vector<int64_t> takeEnds() {
    std::vector<int64_t> codes;
    while (object_->callCount() > 0) {
      const auto call = object_->takeCall();
      if (call.member != "stopRecordingWithError") continue;
      const auto error = platform::decodeError(call.arguments[0].asDictionary());
      codes.push_back(error ? error->code : 0);
      lastMovie_ = call.arguments[1].asString();
    }
    return codes;
  }
  [[nodiscard]] const std::string& lastMovie() const { return lastMovie_; }
  [[nodiscard]] const std::optional<Answer>& answer() const { return seen_->answer; }
  [[nodiscard]] bool isEnded() const { return seen_->ended; }
  [[nodiscard]] const std::string& bundleID() const { return bundleID_; }
  fakes::RecordingExportedObject& object() { return *object_; }

 private:
  fakes::FakeDevice& device_;
  const std::string bundleID_;
  const pid_t pid_;
  const std::shared_ptr<fakes::RecordingExportedObject> object_ = std::make_shared<fakes::RecordingExportedObject>();
  std::shared_ptr<platform::IPCConnection> connection_;
  std::string lastMovie_;
  struct Seen {
    std::optional<Answer> answer;
    bool ended = false;
  };
  const std::shared_ptr<Seen> seen_ = std::make_shared<Seen>();
};

/// The daemon on a device of fakes, with two applications installed and in front.
class DaemonTest : public testing::Test {
 protected:
  DaemonTest() {
    install("Game", "com.example.game", 100);
    install("Chat", "com.example.chat", 200);
    device_.deviceInfo.internalBuild = true;
    device_.run();
    EXPECT_EQ(manager_->finishStartup(), std::nullopt);
  }
  ~DaemonTest() override {
    manager_.reset();
    captureManager_.stopAllCapture();
    device_.run();
  }

  void install(const std::string& name, const std::string& bundleID, pid_t pid) {
    device_.bundles.addApplication(name, bundleID);
    device_.bundles.setProcess(pid, "/Applications/" + name + "/bin/run");
    device_.applications.states[bundleID] = platform::kApplicationForeground;
    device_.applications.processes[bundleID] = pid;
  }
  TestClient game() { return {device_, "com.example.game", 100}; }
  TestClient chat() { return {device_, "com.example.chat", 200}; }
  TestClient systemUI() {
    install("System", "com.example.system", 300);
    return {device_, "com.example.system", 300, {{"com.tarnwick.private.quorvel", platform::Value(true)}}};
  }
  /// Consent is not what this test is about.
  void suppressAlert() { device_.preferences.set("com.tarnwick.quorveld", "QVSuppressAlert", platform::Value(false)); }
  void sendFrame(int64_t nanoseconds, uint64_t flags = 0) {
    device_.screen.last().sendAt(nanoseconds, flags);
    device_.run();
  }
  int openTransactions() { return device_.keepAlive.count; }

  fakes::FakeDevice device_;
  QVCaptureManager captureManager_{device_.platform};
  std::shared_ptr<QVRecordingManager> manager_ = QVRecordingManager::create(captureManager_);
};

}  // namespace qv
