#include "tests/daemon/DaemonTest.h"

#include <algorithm>

namespace qv {

TestClient::TestClient(fakes::FakeDevice& device, std::string bundleID, pid_t pid, platform::Dictionary entitlements,
                       bool waits, uid_t user)
    : device_(device), bundleID_(std::move(bundleID)) {
  platform::IPCPeer peer;
  peer.processIdentifier = pid;
  peer.userIdentifier = user;
  if (!bundleID_.empty()) peer.bundleIdentifier = bundleID_;
  peer.entitlements = std::move(entitlements);
  peer.identity = identity_;
  device.ipc.setClientPeer(peer);
  connection_ = *device.ipc.connect(kServiceName);
  connection_->setRemoteInterface(daemonProtocol());
  connection_->setExportedInterface(clientProtocol(), object_);
  // Handlers may come after this object has gone.
  connection_->setInvalidationHandler([seen = seen_] { seen->ended = true; });
  connection_->setInterruptionHandler([seen = seen_] { seen->ended = true; });
  connection_->resume();
  if (waits) device.run();
}

TestClient::Slot TestClient::post(const char* member, platform::IPCArguments arguments) {
  seen_->answer.reset();
  const auto slot = std::make_shared<std::optional<Answer>>();
  const auto take = [seen = seen_, slot](Answer answer) { *slot = seen->answer = std::move(answer); };
  connection_->call(
      member, std::move(arguments),
      [take](const platform::IPCArguments& values) {
        take({values, std::nullopt});
      },
      [take](const platform::Error& error) {
        take({{}, error});
      });
  return slot;
}

void TestClient::send(const char* member, platform::IPCArguments arguments) {
  post(member, std::move(arguments));
  device_.run();
}

std::optional<TestClient::Answer> TestClient::request(const char* member, platform::IPCArguments arguments) {
  send(member, std::move(arguments));
  return seen_->answer;
}

platform::IPCArguments TestClient::startArguments(const StartOptions& o) {
  using platform::Value;
  platform::Array contexts;
  for (const uint32_t context : o.contexts) contexts.emplace_back(context);
  return {Value(contexts),     Value(platform::Array{Value(o.width), Value(o.height)}),
          Value(o.microphone), Value(o.camera),
          Value(o.broadcast),  Value(o.system),
          Value(o.capture),    Value(platform::Array{})};
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

std::optional<TestClient::End> TestClient::takeEnd() {
  while (object_->callCount() > 0) {
    const auto call = object_->takeCall();
    if (call.member != "stopRecordingWithError") continue;
    const auto error = platform::decodeError(call.arguments[0].asDictionary());
    return End{error ? error->code : 0, call.arguments[1].asString()};
  }
  return std::nullopt;
}

std::vector<int64_t> TestClient::takeEnds() {
  std::vector<int64_t> codes;
  while (const auto end = takeEnd()) {
    codes.push_back(end->code);
    lastMovie_ = end->movie;
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
  device_.run();
}

void DaemonTest::install(const std::string& name, const std::string& bundleID, pid_t pid) {
  device_.bundles.addNamedApplication(name, bundleID);
  device_.bundles.setProcess(pid, "/Applications/" + name + "/bin/run");
  device_.applications.states[bundleID] = platform::kApplicationForeground;
  device_.applications.processes[bundleID] = pid;
}

TestClient DaemonTest::game() { return {device_, "com.example.game", 100}; }
TestClient DaemonTest::gameOf(uid_t user) {
  const pid_t pid = 100 + static_cast<pid_t>(user);
  device_.bundles.setProcess(pid, "/Applications/Game/bin/run", user);
  return {device_, "com.example.game", pid, {}, true, user};
}
TestClient DaemonTest::chat() { return {device_, "com.example.chat", 200}; }

TestClient DaemonTest::namesake() {
  install("Game Again", "com.example.namesake", 150);
  device_.bundles.addApplication("Game Again",
                                 R"({"CFBundleIdentifier": "com.example.namesake", "CFBundleDisplayName": "Game"})");
  return {device_, "com.example.namesake", 150};
}

TestClient DaemonTest::systemUI() {
  install("System", "com.example.system", 300);
  return {device_, "com.example.system", 300, {{"com.tarnwick.private.quorvel", platform::Value(true)}}};
}

void DaemonTest::suppressAlert() { device_.preferences.set(R"({"QVSuppressAlert": false})"); }

void DaemonTest::sendFrame(int64_t nanoseconds, uint64_t flags) {
  const auto& all = device_.screen.controllers;
  const auto running = std::find_if(all.rbegin(), all.rend(), [](const auto* each) { return each->running; });
  if (running != all.rend()) (*running)->sendAt(nanoseconds, flags);
  device_.run();
}

std::string DaemonTest::contentAt(const std::string& url) {
  const auto content = device_.disk.readFile(platform::URL(url).path());
  return content ? content.value() : std::string();
}

void DaemonTest::record(TestClient& client, const TestClient::StartOptions& options) {
  EXPECT_EQ(client.start(options)->code(), 0);
  sendFrame(kSecond);
}

std::string DaemonTest::stop(TestClient& client) {
  const auto answer = client.stop();
  EXPECT_EQ(answer->code(1), 0);
  const std::string movie = answer->values[0].asString();
  EXPECT_NE(contentAt(movie), "") << movie;
  return movie;
}

std::string DaemonTest::recordMovie(TestClient& client) {
  record(client);
  return stop(client);
}

void DaemonTest::speak(int64_t time, uint32_t frames) {
  device_.deviceCapture.send(platform::SampleBuffer::makeAudio(
      std::make_shared<platform::DataBlock>(std::vector<uint8_t>(size_t{frames} * 2, 9)),
      captureManager_.createAudioFormatDescription(), frames,
      platform::MediaTime::make(time, platform::kHostTimescale)));
}

bool DaemonTest::areSourcesOff() {
  const auto runs = [](const auto& source) { return source->running; };
  const auto& session = device_.deviceCapture.session;
  return std::none_of(device_.screen.controllers.begin(), device_.screen.controllers.end(), runs) &&
         std::none_of(device_.tap.taps.begin(), device_.tap.taps.end(), runs) && !(session && session->running) &&
         device_.screen.mode == platform::DisplayCloneMode::Off;
}

}  // namespace qv
