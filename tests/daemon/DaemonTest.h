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
  TestClient(fakes::FakeDevice& device, std::string bundleID, pid_t pid, platform::Dictionary entitlements = {});

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

  void send(const char* member, platform::IPCArguments arguments = {});
  /// Like `send`, but nothing has run yet.
  void post(const char* member, platform::IPCArguments arguments = {});
  std::optional<Answer> request(const char* member, platform::IPCArguments arguments = {});
  void postStart(const StartOptions& o);
  std::optional<Answer> start(const StartOptions& o);
  std::optional<Answer> start() { return start(StartOptions{}); }
  std::optional<Answer> stop() { return request("stopRecordingWithHandler"); }
  platform::Dictionary state();
  bool isRecording() { return valueForKey(state(), "isRecording").asBool(); }
  void disconnect();
  void leave() { connection_->invalidate(); }
  /// The codes of the end-of-recording messages so far; 0 for none. Takes them.
  std::vector<int64_t> takeEnds();
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
  DaemonTest();
  ~DaemonTest() override;

  void install(const std::string& name, const std::string& bundleID, pid_t pid);
  TestClient game();
  TestClient chat();
  TestClient systemUI();
  /// Consent is not what this test is about.
  void suppressAlert();
  void sendFrame(int64_t nanoseconds, uint64_t flags = 0);
  int openTransactions() { return device_.keepAlive.count; }

  fakes::FakeDevice device_;
  QVCaptureManager captureManager_{device_.platform};
  std::shared_ptr<QVRecordingManager> manager_ = QVRecordingManager::create(captureManager_);
};

}  // namespace qv
