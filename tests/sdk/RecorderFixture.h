#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "protocol/QVClientProtocol.h"
#include "protocol/QVDaemonProtocol.h"
#include "sdk/client/RecorderClient.h"
#include "tests/fakes/FakeIPC.h"
#include "tests/fakes/ManualExecutor.h"
#include "tests/fakes/ManualTimers.h"

namespace qv::client {

using platform::Array;
using platform::Data;
using platform::Dictionary;
using platform::IPCArguments;
using platform::Value;
using Log = std::vector<std::string>;
using namespace std::chrono_literals;

/// A recorder, and a daemon that does only what the test makes it do.
class RecorderFixture : public ::testing::Test, protected platform::IPCListenerDelegate {
 protected:
  RecorderFixture() {
    startDaemon();
    recorder_ = makeRecorder();
  }
  ~RecorderFixture() override {
    run();
    recorder_.reset();
    listener_.reset();
    daemonEnd_.reset();
    run();
  }

  void startDaemon() {
    listener_ = ipc_->createListener(kServiceName);
    listener_->setDelegate(this, daemonQueue_);
    EXPECT_FALSE(listener_->resume());
  }
  /// The daemon dies: its socket and its connections are gone.
  void killDaemon() {
    run();
    listener_.reset();
    if (daemonEnd_) daemonEnd_->invalidate();
    daemonEnd_.reset();
    run();
  }
  std::unique_ptr<quorvel::Recorder> makeRecorder() {
    quorvel::RecorderOptions options;
    options.events = events();
    return std::make_unique<RecorderClient>(ipc_, timers_, executor_, std::move(options));
  }
  virtual quorvel::Events events() {
    quorvel::Events events;
    events.stopped = [this](const quorvel::StopResult& result) { note("stopped " + describe(result)); };
    events.interrupted = [this] { note("interrupted"); };
    events.connected = [this] { note("connected"); };
    events.recordingStateChanged = [this](bool on) { note(on ? "state on" : "state off"); };
    events.broadcastURLChanged = [this](const std::string& url) { note("url " + url); };
    events.broadcastServiceInfoChanged = [this](const quorvel::Dictionary& info) { serviceInfo_ = info; };
    events.recordingLockInterrupted = [this](const quorvel::Error& error) { note("lock " + error.key); };
    events.recordingTimerChanged = [this](const std::string& time) { note("timer " + time); };
    events.videoFrame = [this](quorvel::VideoFrame frame) { frames_.push_back(std::move(frame)); };
    events.audioSample = [this](quorvel::AudioSample sample) { samples_.push_back(std::move(sample)); };
    return events;
  }
  bool listenerShouldAcceptNewConnection(platform::IPCListener&,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override {
    connection->setExportedInterface(daemonProtocol(), daemon_);
    connection->setRemoteInterface(clientProtocol());
    connection->resume();
    daemonEnd_ = connection;
    return true;
  }

  void run() { executor_.runUntilIdle(); }
  void note(std::string event) { log_.push_back(std::move(event)); }
  /// What happened since the last time.
  std::vector<std::string> takeLog() {
    run();
    return std::exchange(log_, {});
  }
  static std::string describe(const quorvel::StopResult& result) {
    return (result.error ? std::to_string(result.error->code) : "ok") + " " + result.movieURL;
  }
  auto stopHandler() {
    return [this](const quorvel::StopResult& result) { note("stop " + describe(result)); };
  }
  auto startHandler() {
    return [this](const quorvel::StartResult& result) {
      note("start " + (result.error ? std::to_string(result.error->code) : "ok"));
    };
  }
  auto completion() {
    return [this](const std::optional<quorvel::Error>& error) {
      note("done " + (error ? std::to_string(error->code) + " " + error->text : "ok"));
    };
  }
  auto failure() {
    return [this](const quorvel::Error& error) { note("failed " + std::to_string(error.code)); };
  }
  /// The oldest call that the daemon got.
  fakes::RecordingExportedObject::ReceivedCall takeCall() {
    run();
    return daemon_->takeCall();
  }
  void startRecording() {
    recorder_->start({.windows = {7}}, startHandler());
    takeCall().reply({platform::Dictionary(), false, false});
    run();
  }
  void tellClient(const char* member, platform::IPCArguments arguments) {
    daemonEnd_->call(member, std::move(arguments), {}, {});
  }

  fakes::ManualExecutor executor_;
  fakes::ManualTimers timers_;
  platform::SerialQueue daemonQueue_{"daemon", executor_};
  const std::shared_ptr<fakes::FakeIPCService> ipc_ = std::make_shared<fakes::FakeIPCService>(executor_);
  const std::shared_ptr<fakes::RecordingExportedObject> daemon_ = std::make_shared<fakes::RecordingExportedObject>();
  std::unique_ptr<platform::IPCListener> listener_;
  std::shared_ptr<platform::IPCConnection> daemonEnd_;
  std::unique_ptr<quorvel::Recorder> recorder_;
  std::vector<std::string> log_;
  quorvel::Dictionary serviceInfo_;
  std::vector<quorvel::VideoFrame> frames_;
  std::vector<quorvel::AudioSample> samples_;
};

}  // namespace qv::client
