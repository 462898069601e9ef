#include <unistd.h>

#include "tests/sdk/RecorderFixture.h"

namespace qv::client {
namespace {

const Dictionary kDeclined = platform::encodeError(platform::Error{
    quorvel::kErrorDomain, -5801, {{platform::kLocalizedDescriptionKey, Value("Die Aufnahme wurde abgelehnt.")}}});

class RecorderRequests : public RecorderFixture {};

TEST_F(RecorderRequests, StartSendsItsOptionsAndBringsTheAnswer) {
  int ends[2];
  ASSERT_EQ(::pipe(ends), 0);
  quorvel::StartResult result;
  recorder_->start({.windows = {0x200001, 0x200002},
                    .width = 1280,
                    .height = 720,
                    .microphone = true,
                    .broadcast = true,
                    .capture = true,
                    .listenerEndpoint = ends[0]},
                   [&](quorvel::StartResult started) { result = std::move(started); });
  ::close(ends[0]);
  auto call = takeCall();
  ASSERT_EQ(call.member, "startRecordingWindowLayerContextIDs");
  const auto endpoint = call.arguments.back().asArray();
  call.arguments.pop_back();
  EXPECT_EQ(call.arguments,
            (IPCArguments{Array{0x200001u, 0x200002u}, Array{1280.0, 720.0}, true, false, true, false, true}));
  ASSERT_EQ(endpoint.size(), 1u);
  // The copy that was sent is the same pipe.
  ASSERT_EQ(::write(ends[1], "x", 1), 1);
  char byte = 0;
  EXPECT_EQ(::read((*endpoint[0].getIf<platform::SharedFileDescriptor>())->get(), &byte, 1), 1);
  ::close(ends[1]);

  call.reply({kDeclined, true, false});
  run();
  ASSERT_TRUE(result.error);
  EXPECT_EQ(result.error->code, quorvel::kErrorUserDeclined);
  EXPECT_EQ(result.error->key, "RECORDING_ERROR_USER_DECLINED");
  EXPECT_EQ(result.error->text, "Die Aufnahme wurde abgelehnt.");
  EXPECT_TRUE(result.microphone);
  EXPECT_FALSE(result.camera);
}

TEST_F(RecorderRequests, AStartWithAClosedEndpointFailsAlone) {
  recorder_->start({.listenerEndpoint = 9999}, startHandler());
  EXPECT_EQ(takeLog(), Log{"start -5800"});
  EXPECT_FALSE(daemonEnd_);
}

TEST_F(RecorderRequests, EveryRequestReachesItsOperation) {
  struct Case {
    std::function<void(quorvel::Recorder&)> request;
    std::string member;
    IPCArguments arguments;
  };
  const std::vector<Case> cases = {
      {[](auto& r) { r.stop({.startClip = std::chrono::seconds(2), .endClip = std::chrono::milliseconds(1500)}, {}); },
       "stopRecordingWithStartClipDuration",
       {2.0, 1.5}},
      {[](auto& r) { r.resume(0xfffffff0u); }, "resumeRecordingWithWindowLayerContextID", {0xfffffff0u}},
      {[](auto& r) { r.setMicrophoneEnabled(true); }, "setMicrophoneEnabled", {true}},
      {[](auto& r) { r.updateProcessIDForAudioCapture(4711); }, "updateProcessIDForAudioCaptureWithPID", {4711}},
      {[](auto& r) { r.discard({}); }, "discardRecordingWithHandler", {}},
      {[](auto& r) { r.saveVideoToCameraRoll("file:///a.mp4", {}); }, "saveVideoToCameraRoll", {"file:///a.mp4"}},
      {[](auto& r) { r.didResignActive(); }, "clientDidResignActive", {}},
      {[](auto& r) {
         r.setupBroadcast({.hostBundleID = "h",
                           .extensionBundleID = "e",
                           .configuration = {1, 2},
                           .userInfo = {{"k", {int64_t{3}}}}},
                          {});
       },
       "setupBroadcastWithHostBundleID",
       {"h", "e", Data{1, 2}, Dictionary{{"k", int64_t{3}}}}},
      {[](auto& r) { r.setBroadcastURL("https://x"); }, "setBroadcastURL", {"https://x"}},
      {[](auto& r) { r.setHasUserConsentForCamera(true); }, "setHasUserConsentForCamera", {true}},
      {[](auto& r) { r.setHasUserConsentForMicrophone(true); }, "setHasUserConsentForMicrophone", {true}},
      {[](auto& r) { r.setMicrophoneEnabledPersistent(true); }, "setMicrophoneEnabledPersistent", {true}},
      {[](auto& r) { r.reportCameraUsage(-2); }, "reportCameraUsage", {-2}},
  };
  for (const Case& each : cases) {
    each.request(*recorder_);
    const auto call = takeCall();
    EXPECT_EQ(call.member, each.member);
    EXPECT_EQ(call.arguments, each.arguments) << each.member;
  }
}

TEST_F(RecorderRequests, AnswersAreDecoded) {
  recorder_->stop(stopHandler());
  takeCall().reply({"file:///tmp/a%20b.mp4", Value()});
  recorder_->discard(completion());
  takeCall().reply({});
  EXPECT_EQ(takeLog(), (Log{"connected", "stop ok file:///tmp/a%20b.mp4", "done ok"}));
  EXPECT_EQ(quorvel::filePath("file:///tmp/a%20b.mp4"), "/tmp/a b.mp4");

  recorder_->currentState([&](const quorvel::StateResult& result) {
    note(result.state.recording && result.state.userConsentForCamera && !result.state.broadcasting ? "flags" : "?");
    note(result.state.broadcastURL.value_or("no url"));
  });
  takeCall().reply({Dictionary{{"isRecording", true}, {"hasUserConsentForCamera", true}, {"broadcastURL", "u"}}});
  EXPECT_EQ(takeLog(), (Log{"flags", "u"}));

  recorder_->currentBroadcastImages([&](const quorvel::BroadcastImagesResult& result) {
    note(std::to_string(result.hostApp.size()) + "/" + std::to_string(result.extension.size()));
  });
  takeCall().reply({Data{1, 2, 3}, Value()});
  recorder_->systemBroadcastExtensions([&](const quorvel::BroadcastExtensionsResult& result) {
    for (const auto& extension : result.extensions) note(extension.displayName + " " + extension.bundleID);
  });
  takeCall().reply({Array{Dictionary{{"displayName", "Live"}, {"extBundleID", "com.x.live"}}}, Value()});
  EXPECT_EQ(takeLog(), (Log{"3/0", "Live com.x.live"}));
}

TEST_F(RecorderRequests, ARefusedCallEndsInAnErrorThatNamesIt) {
  recorder_->discard(completion());
  takeCall().reply.fail("com.tarnwick.quorveld.Error.Recording", "a recording is in progress");
  recorder_->stop(stopHandler());
  takeCall();  // and dropped unanswered
  const Log log = takeLog();
  ASSERT_EQ(log.size(), 3u);
  EXPECT_NE(log[1].find("done -5800"), std::string::npos);
  EXPECT_NE(log[1].find("com.tarnwick.quorveld.Error.Recording: a recording is in progress"), std::string::npos);
  EXPECT_EQ(log[2], "stop -5800 ");
}

TEST_F(RecorderRequests, RepliesWithoutSenseEndInErrorsOrDefaults) {
  const Dictionary noError{{"code", "?"}};
  recorder_->start({}, startHandler());
  takeCall().reply({true});
  recorder_->start({}, startHandler());
  takeCall().reply({noError, false, false});
  recorder_->stop(stopHandler());
  takeCall().reply({"file:///x", noError});
  recorder_->saveVideoToCameraRoll("x", [this](const auto& error) { note(error ? "not saved" : "saved"); });
  takeCall().reply({Dictionary{{"domain", 7}}});
  recorder_->currentState([this](const auto& result) { note(result.state.recording ? "records" : "idle"); });
  takeCall().reply({Dictionary{{"isRecording", "yes"}, {"broadcastURL", 3}}});
  recorder_->systemBroadcastExtensions([this](const auto& result) { note(std::to_string(result.extensions.size())); });
  takeCall().reply({Array{Dictionary{{"extBundleID", 3}}}, Value()});
  EXPECT_EQ(takeLog(),
            (Log{"connected", "start -5800", "start -5800", "stop -5800 file:///x", "not saved", "idle", "1"}));
}

TEST_F(RecorderRequests, ErrorsOfOtherDomainsKeepCodeAndDomain) {
  std::optional<quorvel::Error> error;
  recorder_->saveVideoToCameraRoll("file:///gone", [&](std::optional<quorvel::Error> e) { error = std::move(e); });
  takeCall().reply({platform::encodeError(platform::Error::posix(2))});
  run();
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, 2);
  EXPECT_EQ(error->domain, "posix");
  EXPECT_EQ(error->key, "RECORDING_ERROR_UNKNOWN");
  EXPECT_EQ(quorvel::errorKey(-5818), "RECORDING_ERROR_MIXING_FAILURE");
  EXPECT_EQ(quorvel::errorKey(-5814), "RECORDING_ERROR_CONNECTION_INVALID");
  EXPECT_EQ(quorvel::errorKey(-5819), "RECORDING_ERROR_UNKNOWN");
}

}  // namespace
}  // namespace qv::client
