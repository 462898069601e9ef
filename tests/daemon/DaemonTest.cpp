#include "tests/daemon/DaemonTest.h"

namespace qv {

TestClient::TestClient(fakes::FakeDevice& device, std::string bundleID, pid_t pid, platform::Dictionary entitlements)
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

void TestClient::post(const char* member, platform::IPCArguments arguments) {
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

void TestClient::send(const char* member, platform::IPCArguments arguments) {
  post(member, std::move(arguments));
  device_.run();
}

std::optional<TestClient::Answer> TestClient::request(const char* member, platform::IPCArguments arguments) {
  send(member, std::move(arguments));
  return seen_->answer;
}

void TestClient::postStart(const StartOptions& o) {
  using platform::Value;
  platform::Array contexts;
  for (const uint32_t context : o.contexts) contexts.emplace_back(context);
  post("startRecordingWindowLayerContextIDs",
       {Value(contexts), Value(platform::Array{Value(o.width), Value(o.height)}), Value(o.microphone), Value(o.camera),
        Value(o.broadcast), Value(o.system), Value(o.capture), Value(platform::Array{})});
}

std::optional<TestClient::Answer> TestClient::start(const StartOptions& o) {
  postStart(o);
  device_.run();
  return seen_->answer;
}

void TestClient::disconnect() {
  leave();
  device_.run();
}

std::vector<int64_t> TestClient::takeEnds() {
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

platform::Dictionary TestClient::state() { return request("synchronousGetCurrentState")->values.at(0).asDictionary(); }

DaemonTest::DaemonTest() {
  install("Game", "com.example.game", 100);
  install("Chat", "com.example.chat", 200);
  device_.deviceInfo.internalBuild = true;
  device_.run();
  EXPECT_EQ(manager_->finishStartup(), std::nullopt);
}

DaemonTest::~DaemonTest() {
  manager_.reset();
  captureManager_.stopAllCapture();
  device_.run();
}

void DaemonTest::install(const std::string& name, const std::string& bundleID, pid_t pid) {
  device_.bundles.addApplication(name, bundleID);
  device_.bundles.setProcess(pid, "/Applications/" + name + "/bin/run");
  device_.applications.states[bundleID] = platform::kApplicationForeground;
  device_.applications.processes[bundleID] = pid;
}

TestClient DaemonTest::game() { return {device_, "com.example.game", 100}; }
TestClient DaemonTest::chat() { return {device_, "com.example.chat", 200}; }

TestClient DaemonTest::systemUI() {
  install("System", "com.example.system", 300);
  return {device_, "com.example.system", 300, {{"com.tarnwick.private.quorvel", platform::Value(true)}}};
}

void DaemonTest::suppressAlert() {
  device_.preferences.set("com.tarnwick.quorveld", "QVSuppressAlert", platform::Value(false));
}

void DaemonTest::sendFrame(int64_t nanoseconds, uint64_t flags) {
  device_.screen.last().sendAt(nanoseconds, flags);
  device_.run();
}

}  // namespace qv
