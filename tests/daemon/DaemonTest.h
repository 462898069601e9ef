#pragma once

#include <optional>
#include <string>
#include <vector>

#include "daemon/QVRecordingManager.h"
#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "support/QuorvelErrors.h"
#include "tests/fakes/FakeDevice.h"

namespace qv {

inline constexpr int64_t kSecond = 1'000'000'000;

/// What an application sees of the daemon.
class TestClient {
 public:
  /// Unless it `waits` the daemon has not seen it yet.
  TestClient(fakes::FakeDevice& device, std::string bundleID, pid_t pid, platform::Dictionary entitlements = {},
             bool waits = true, uid_t user = 0);

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

  /// The answer of one request, when it has come.
  using Slot = std::shared_ptr<std::optional<Answer>>;
  /// One end-of-recording message; code 0 for none.
  struct End {
    int64_t code = 0;
    std::string movie;
  };

  static constexpr const char* kStart = "startRecordingWindowLayerContextIDs";
  void send(const char* member, platform::IPCArguments arguments = {});
  /// Like `send`, but nothing has run yet.
  Slot post(const char* member, platform::IPCArguments arguments = {});
  std::optional<Answer> request(const char* member, platform::IPCArguments arguments = {});
  static platform::IPCArguments startArguments(const StartOptions& o);
  Slot postStart(const StartOptions& o) { return post(kStart, startArguments(o)); }
  std::optional<Answer> start(const StartOptions& o);
  std::optional<Answer> start() { return start(StartOptions{}); }
  std::optional<Answer> stop() { return request("stopRecordingWithHandler"); }
  platform::Dictionary state();
  bool isRecording() { return valueForKey(state(), "isRecording").asBool(); }
  void disconnect();
  void leave() { connection_->invalidate(); }
  /// It does not read what it is sent.
  void fallBehind() { std::dynamic_pointer_cast<fakes::FakeIPCConnection>(connection_)->fallBehind(); }
  /// Its process executes another program, and keeps the connection.
  void becomeAnotherProgram() { identity_->now = platform::PeerStanding::AnotherProgram; }
  /// Its executable is replaced while it runs.
  void isUpdated() { identity_->now = platform::PeerStanding::Uninstalled; }
  /// Takes the oldest end-of-recording message.
  std::optional<End> takeEnd();
  /// The codes of the end-of-recording messages so far; 0 for none. Takes them.
  std::vector<int64_t> takeEnds();
  [[nodiscard]] const std::string& lastMovie() const { return lastMovie_; }
  [[nodiscard]] const std::optional<Answer>& answer() const { return seen_->answer; }
  [[nodiscard]] bool isEnded() const { return seen_->ended; }
  [[nodiscard]] const std::string& bundleID() const { return bundleID_; }
  fakes::RecordingExportedObject& object() { return *object_; }

 private:
  struct Identity final : platform::PeerIdentity {
    platform::PeerStanding standing() const override { return now; }
    platform::PeerStanding now = platform::PeerStanding::Same;
  };
  const std::shared_ptr<Identity> identity_ = std::make_shared<Identity>();
  fakes::FakeDevice& device_;
  const std::string bundleID_;
  const std::shared_ptr<fakes::RecordingExportedObject> object_ = std::make_shared<fakes::RecordingExportedObject>();
  std::shared_ptr<platform::IPCConnection> connection_;
  std::string lastMovie_;
  struct Seen {
    std::optional<Answer> answer;
    bool ended = false;
  };
  const std::shared_ptr<Seen> seen_ = std::make_shared<Seen>();
};

/// The daemon on a device of fakes, with two applications installed and in front. (daemon_random_test drives it at
/// random: QUORVEL_RANDOM_SECONDS=600 for longer, QUORVEL_RANDOM_SEED=n for one run again, both by the environment.)
class DaemonTest : public testing::Test {
 protected:
  DaemonTest();
  ~DaemonTest() override;

  void install(const std::string& name, const std::string& bundleID, pid_t pid);
  TestClient game();
  /// The same program, which another user runs.
  TestClient gameOf(uid_t user);
  TestClient chat();
  /// Another application that is called "Game".
  TestClient namesake();
  TestClient systemUI();
  /// Consent is not what this test is about.
  void suppressAlert();
  /// By the newest screen capture that runs, if any does.
  void sendFrame(int64_t nanoseconds, uint64_t flags = 0);
  std::shared_ptr<QVRecording> recordingOf(const TestClient& client) {
    return manager_->sessions().find(client.bundleID())->recording();
  }
  /// Some of the daemon's work.
  void runWork(int count) {
    for (int done = 0; done < count && device_.executor.runOne(); ++done) {
    }
  }
  static constexpr int kPieces = 24;  ///< more than a start takes
  /// What a file holds; nothing where there is none.
  std::string contentAt(const std::string& url);
  bool areSourcesOff();
  /// A recording that has a picture.
  void record(TestClient& client, const TestClient::StartOptions& options = {});
  /// The URL of a stop that is answered with a movie that is there.
  std::string stop(TestClient& client);
  std::string recordMovie(TestClient& client);
  static int64_t save(TestClient& client, const std::string& movie) {
    return client.request("saveVideoToCameraRoll", {platform::Value(movie)})->code();
  }
  /// To the microphone, from a host time in nanoseconds on.
  void speak(int64_t time, uint32_t frames);
  int openTransactions() { return device_.keepAlive.count; }

  fakes::FakeDevice device_;
  QVCaptureManager captureManager_{device_.platform};
  std::shared_ptr<QVRecordingManager> manager_ = QVRecordingManager::create(device_.platform, captureManager_);
};

/// Where consent is not what a test is about.
class QuietDaemonTest : public DaemonTest {
 protected:
  QuietDaemonTest() { suppressAlert(); }
};

}  // namespace qv
