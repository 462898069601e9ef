#include <algorithm>
#include <cmath>
#include <cstring>

#include "platform/base/KeyedArchive.h"
#include "tests/daemon/BroadcastFixture.h"

namespace qv {
namespace {

using platform::Data;
using platform::Dictionary;
using platform::ExtensionItem;
using platform::Value;

class BroadcastTest : public BroadcastFixture {
 protected:
  BroadcastTest() : client_(game()) {}
  ~BroadcastTest() override { client_.disconnect(); }

  int64_t startBroadcast() {
    client_.send("noSuchRequest");
    const auto answer = client_.start({.broadcast = true});
    return answer && !answer->failure ? answer->code() : -1;
  }
  /// A broadcast in samples mode that runs.
  void broadcastSamples() {
    device_.deviceInfo.audioCaptureDevice = true;
    install(client_, kSamples);
    setUp(client_);
    (void)startSamples(client_);
  }
  std::vector<int64_t> actions() {
    std::vector<int64_t> actions;
    for (const auto& payload : extension_.received) {
      if (const Value* action = find(payload, broadcastpayload::kActionType)) actions.push_back(action->asInteger());
    }
    return actions;
  }
  std::string finishFlag(size_t request) {
    return device_.extensions.requests.at(request).value(broadcastitem::kRequestedFinish).asString();
  }
  std::string clipPath(size_t request) {
    return platform::URL(device_.extensions.requests.at(request).value(broadcastitem::kMovieClipURL).asString()).path();
  }
  fakes::FakeAssetWriterService::Movie& movie(size_t index) { return *device_.movies.movies.at(index); }

  TestClient client_;
};

TEST_F(BroadcastTest, SetUpRefusesWhatNoBroadcastCouldComeOf) {
  const auto invalid = errorcode::kInvalidBroadcastSession;
  EXPECT_EQ(setUp(client_), invalid) << "no extension";
  install(client_, kSamples);
  EXPECT_EQ(setUp(client_, {1, 2, 3}), invalid);
  EXPECT_EQ(setUp(client_, platform::encodeKeyedArchive("Other", {})), invalid);
  EXPECT_EQ(setUp(client_, clipsOf(-1)), invalid);
  EXPECT_EQ(setUp(client_, clipsOf(std::nan(""))), invalid);
  EXPECT_EQ(setUp(client_, QVBroadcastConfiguration{1, {{"k", Value(std::string(2 << 20, 'x'))}}}.encode()), invalid);
  EXPECT_EQ(setUp(client_, clipsOf(5), "com"), invalid) << "would match every extension";
  EXPECT_EQ(setUp(client_, clipsOf(5), "com.example.game.setup", "com.example.chat"), errorcode::kEntitlements);
  EXPECT_EQ(startBroadcast(), invalid);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(BroadcastTest, SetUpFindsTheExtensionAndShowsItsImages) {
  const Data icon{1, 2, 3};
  auto general = std::make_shared<platform::ExtensionRecord>();
  general->identifier = "com.example.game.general";
  general->extensionPointIdentifier = broadcastpoint::kGeneral;
  general->icons = {icon};
  device_.extensions.installed.push_back(general);
  device_.bundles.addApplication("Game",
                                 R"({"CFBundleIdentifier": "com.example.game", "CFBundleIconFile": "Icon.png"})");
  device_.disk.addFile("/Applications/Game/Resources/Icon.png", "PNG");
  EXPECT_EQ(setUp(client_), 0);
  const auto images = client_.request("getCurrentBroadcastImages")->values;
  EXPECT_EQ(images[0].asData(), (Data{'P', 'N', 'G'}));
  EXPECT_EQ(images[1].asData(), icon);
  EXPECT_TRUE(client_.request("getSystemBroadcastExtensionInfo")->values[0].asArray().empty()) << "none of that point";

  auto upload = std::make_shared<platform::ExtensionRecord>(*general);
  upload->identifier = "com.example.chat.upload";
  upload->extensionPointIdentifier = broadcastpoint::kUpload;
  upload->displayName = "Live";
  device_.extensions.installed.push_back(upload);
  device_.extensions.install("com.example.plain", broadcastpoint::kUpload);
  const auto list = client_.request("getSystemBroadcastExtensionInfo")->values[0].asArray();
  EXPECT_EQ(list.at(0), Value(Dictionary{{"displayName", Value("Live")},
                                         {"extBundleID", Value("com.example.chat.upload")},
                                         {"extAppImgData", Value(icon)}}));
  EXPECT_EQ(list.at(1), Value(Dictionary{{"extBundleID", Value("com.example.plain")}}));

  EXPECT_EQ(startBroadcast(), 0);
  client_.stop();
  EXPECT_EQ(client_.request("getCurrentBroadcastImages")->values,
            (platform::IPCArguments{Value(Data{}), Value(Data{})}));
  device_.extensions.queryError = platform::Error{"query", 3, {}};
  const auto failed = client_.request("getSystemBroadcastExtensionInfo");
  EXPECT_TRUE(failed->values[0].asArray().empty());
  EXPECT_EQ(failed->code(1), 3);
  EXPECT_EQ(setUp(client_), errorcode::kInvalidBroadcastSession);
}

TEST_F(BroadcastTest, SamplesReachTheExtensionBetweenStartedAndFinished) {
  broadcastSamples();
  ASSERT_TRUE(client_.answer());
  EXPECT_EQ(client_.answer()->code(), 0);
  EXPECT_TRUE(device_.alerts.shown.empty());
  EXPECT_TRUE(valueForKey(client_.state(), "isBroadcasting").asBool());
  extension_.call("ping");
  EXPECT_EQ(device_.purgeableSpace.callbacks.purge(1, 2), 0) << "it needs no disk";
  frame(10);
  sound(11);
  speak(11);
  client_.request("pauseRecording");
  recordingOf(client_)->resumeSessionWithContextID(5);
  recordingOf(client_)->resumeSessionWithContextID(5);  // it is not paused any more
  device_.run();
  frame(20);
  sound(21);
  client_.request("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{200})});
  extension_.call("updateServiceInfo", {Value(Dictionary{{"viewers", Value(int64_t{5})}})});
  extension_.call("updateBroadcastURL", {Value("https://live")});
  client_.stop();
  EXPECT_EQ(client_.answer()->values[0].asString(), "");
  EXPECT_EQ(client_.answer()->code(1), 0);
  EXPECT_EQ(client_.object().callCount(), 2u) << "service information and the place";

  const auto& payloads = extension_.received;
  ASSERT_EQ(payloads.size(), 10u) << "the sound of another application is not the caller's to record";
  EXPECT_EQ(payloads[0].at(broadcastpayload::kUserInfo), Value(Dictionary{{"key", Value("stream")}}));
  EXPECT_EQ(payloads[1], (Dictionary{{broadcastpayload::kFrontmostApp, Value("com.example.game")}}));
  EXPECT_EQ(payloads[2].size(), 5u);
  EXPECT_TRUE(QVSharedFrameObject::decodeFromIPC(payloads[2].at(broadcastpayload::kSharedFrame)).sharedFrame());
  EXPECT_EQ(payloads[2].at(broadcastpayload::kTimingInfo).asData().size(), 72u);
  EXPECT_EQ(payloads[3].size(), 6u);
  EXPECT_EQ(payloads[3].at(broadcastpayload::kNumSamples).asInteger(), 4410);
  EXPECT_EQ(payloads[3].at(broadcastpayload::kAudioFormatDescription).asData().size(), 40u);
  EXPECT_EQ(payloads[4].at(broadcastpayload::kSampleType).asInteger(), 3) << "the microphone";
  for (const size_t resumed : {7, 8}) {
    platform::MediaTime pauses;
    ASSERT_EQ(payloads[resumed].at(broadcastpayload::kPauses).asData().size(), sizeof pauses);
    std::memcpy(&pauses, payloads[resumed].at(broadcastpayload::kPauses).asData().data(), sizeof pauses);
    EXPECT_EQ(pauses, platform::MediaTime::make(1, 1)) << resumed;
  }
  EXPECT_EQ(actions(), (std::vector<int64_t>{1, 2, 3, 4}));
  EXPECT_EQ(device_.extensions.killed.size(), 1u);
  EXPECT_TRUE(device_.movies.movies.empty());
  EXPECT_EQ(openTransactions(), 0);
  EXPECT_EQ(startBroadcast(), errorcode::kInvalidBroadcastSession) << "a set-up is for one broadcast";
}

TEST_F(BroadcastTest, AnExtensionThatGoesEndsItsBroadcastOnly) {
  broadcastSamples();
  extension_.answers = false;
  frame(10);
  device_.tap.tap->atStop = [this] { (void)device_.tap.fill(441, kSecond); };
  extension_.connection->invalidate();
  device_.run();
  EXPECT_EQ(client_.takeEnds(), std::vector<int64_t>{errorcode::kInvalidBroadcastSession});
  EXPECT_FALSE(client_.isRecording());
  EXPECT_FALSE(device_.screen.last().running);
  EXPECT_EQ(openTransactions(), 0);
  EXPECT_EQ(device_.log.countContaining("payload to broadcast extension..."), 0u) << "nothing was taken";

  // One that hangs instead costs the stop ten seconds.
  device_.extensions.installed.clear();
  extension_.answers = true;
  broadcastSamples();
  extension_.answers = false;
  client_.send("stopRecordingWithHandler");
  EXPECT_FALSE(client_.answer());
  device_.timers.advance(kExtensionPatience);
  device_.run();
  ASSERT_TRUE(client_.answer());
  EXPECT_EQ(device_.extensions.killed.size(), 2u);
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(BroadcastTest, APausedBroadcastStaysPaused) {
  broadcastSamples();
  client_.request("pauseRecording");
  client_.request("resumeRecordingWithWindowLayerContextID", {Value(uint32_t{77})});
  EXPECT_TRUE(client_.isRecording());
  EXPECT_FALSE(device_.screen.last().running);
}

TEST_F(BroadcastTest, AnApplicationThatLeavesTheFrontWhileItsExtensionIsLaunchedIsRefused) {
  install(client_, kSamples);
  setUp(client_);
  client_.start({.broadcast = true});
  device_.applications.states["com.example.game"] = platform::kApplicationBackground;
  extension_.connect();
  device_.run();
  extension_.call("ping");
  device_.run();
  ASSERT_TRUE(client_.answer());
  EXPECT_EQ(client_.answer()->code(), errorcode::kFailedToStart);
  EXPECT_TRUE(areSourcesOff());
  EXPECT_EQ(openTransactions(), 0);
}

TEST_F(BroadcastTest, AClientThatLeavesWhileTheExtensionIsLaunchedLeavesNothing) {
  install(client_, kSamples);
  setUp(client_);
  client_.start({.broadcast = true});
  client_.disconnect();
  EXPECT_EQ(openTransactions(), 0);
  EXPECT_EQ(device_.extensions.killed.size(), 1u);
  EXPECT_TRUE(device_.screen.controllers.empty());
}

TEST_F(BroadcastTest, ClipsFollowOneAnotherWithoutAGap) {
  install(client_);
  EXPECT_EQ(setUp(client_, clipsOf(2.5)), 0);
  EXPECT_EQ(startBroadcast(), 0);
  play(100, 160, 2);
  // Sound began at 10.0 s, so the first cut is at the sound of 12.6 s, which comes with the picture of 12.8 s.
  ASSERT_EQ(device_.movies.movies.size(), 3u);
  const auto& first = movie(0);
  const auto& second = movie(1);
  EXPECT_EQ(first.inputs[0]->times().back(), 128 * kSecond / 10);
  EXPECT_EQ(second.inputs[0]->times().front(), 129 * kSecond / 10);
  EXPECT_EQ(first.inputs[0]->times().size() + second.inputs[0]->times().size() + movie(2).inputs[0]->times().size(),
            60u);
  // The sound of each clip ends and begins with its pictures.
  const auto& lastSound = first.inputs[1]->samples.back();
  EXPECT_EQ((lastSound->presentationTime() + lastSound->duration()).seconds(), 12.9);
  EXPECT_EQ(second.inputs[1]->times().front(), 129 * kSecond / 10);
  EXPECT_EQ(first.sessionEnd.seconds(), 12.9);
  ASSERT_GE(device_.extensions.requests.size(), 1u);
  EXPECT_EQ(finishFlag(0), "0");
  EXPECT_TRUE(clipPath(0).ends_with("_1.mp4")) << clipPath(0);
  EXPECT_EQ(device_.extensions.requests[0].value(broadcastitem::kSandboxToken).asString(),
            "com.tarnwick.quorveld.read-only for " + clipPath(0));
  client_.stop();
  EXPECT_EQ(client_.answer()->values[0].asString(), "");
  ASSERT_EQ(device_.extensions.requests.size(), 3u);
  EXPECT_EQ(finishFlag(1), "0");
  EXPECT_EQ(finishFlag(2), "1");
}

TEST_F(BroadcastTest, AStillScreensClipBeginsWithTheLastPictureAndCutsTheSoundThere) {
  install(client_);
  setUp(client_, clipsOf(0.5));
  startBroadcast();
  frame(100);
  for (int64_t tenth = 100; tenth <= 106; ++tenth) sound(tenth);
  ASSERT_EQ(device_.movies.movies.size(), 2u);
  EXPECT_TRUE(movie(1).inputs[0]->samples.empty());
  device_.timers.advance(std::chrono::milliseconds(33));
  device_.run();
  EXPECT_TRUE(movie(1).inputs[0]->samples.empty());
  device_.timers.advance(std::chrono::milliseconds(1));
  device_.run();
  EXPECT_EQ(movie(1).inputs[0]->times(), std::vector<int64_t>{107 * kSecond / 10}) << "where the sound had got to";
  EXPECT_EQ(movie(1).inputs[0]->samples[0]->image(), movie(0).inputs[0]->samples[0]->image());
  // A picture that was taken before that is not lost, and sound across a seam is cut at it.
  frame(107);
  frame(106);
  EXPECT_EQ(movie(1).inputs[0]->times(), (std::vector<int64_t>{10'700'000'000, 10'701'000'000, 10'702'000'000}));
  EXPECT_EQ(device_.extensions.requests.size(), 1u);
  for (int64_t tenth = 107; tenth <= 112; ++tenth) sound(tenth);
  ASSERT_EQ(device_.movies.movies.size(), 3u);
  sendFrame(113 * kSecond / 10 + kSecond / 20);
  sound(113);
  EXPECT_EQ(movie(1).inputs[1]->samples.back()->numSamples(), 2205);
  EXPECT_EQ(movie(2).inputs[1]->samples.front()->numSamples(), 2205);
  EXPECT_EQ(movie(2).inputs[1]->times().front(), movie(2).inputs[0]->times().front());
  EXPECT_EQ(device_.extensions.requests.size(), 2u) << "with its sound";
  // One that is newer than the sound is shown for the time of a frame.
  for (int64_t tenth = 114; tenth <= 117; ++tenth) sound(tenth);
  sendFrame(119 * kSecond / 10 - kSecond / 100);
  sound(118);
  ASSERT_EQ(device_.movies.movies.size(), 4u);
  device_.timers.advance(std::chrono::milliseconds(34));
  device_.run();
  EXPECT_EQ(movie(3).inputs[0]->times(), std::vector<int64_t>{11'923'333'333});
}

TEST_F(BroadcastTest, EachRequestRemovesItsOwnClipAndMayChangeTheNext) {
  install(client_);
  setUp(client_, clipsOf(1));
  startBroadcast();
  play(100, 125);
  ASSERT_EQ(device_.extensions.requests.size(), 2u);
  device_.disk.addFile(clipPath(0), "1");
  device_.disk.addFile(clipPath(1), "2");
  device_.extensions.complete(
      1,
      std::vector<ExtensionItem>{item(broadcastitem::kBroadcastConfiguration, Value(Data{9})),
                                 item(broadcastitem::kBroadcastConfiguration, Value(clipsOf(3))),
                                 {broadcastitem::kBroadcastConfiguration, {}},
                                 {broadcastitem::kBroadcastConfiguration, {{"public.text", Value(clipsOf(1))}}},
                                 item("another", Value(Dictionary{{"viewers", Value(int64_t{6})}})),
                                 item(broadcastitem::kServiceInfo, Value(Dictionary{{"viewers", Value(int64_t{5})}}))});
  device_.run();
  EXPECT_TRUE(device_.disk.itemExists(clipPath(0)));
  EXPECT_FALSE(device_.disk.itemExists(clipPath(1)));
  EXPECT_EQ(client_.object().takeCall().member, "updateBroadcastServiceInfo");
  EXPECT_EQ(client_.object().callCount(), 0u);
  play(125, 145);
  EXPECT_EQ(device_.extensions.requests.size(), 2u) << "clips are longer now";
  client_.stop();
  ASSERT_EQ(device_.extensions.requests.size(), 3u);
  EXPECT_TRUE(device_.extensions.killed.empty()) << "it still sends";
  device_.extensions.complete(2, std::vector<ExtensionItem>{});
  device_.run();
  EXPECT_TRUE(device_.extensions.killed.empty()) << "it sends the first one still";
  device_.extensions.complete(0, std::vector<ExtensionItem>{});
  device_.run();
  EXPECT_FALSE(device_.disk.itemExists(clipPath(0)));
  EXPECT_EQ(device_.extensions.killed, std::vector<std::string>{"com.example.game.upload"});
}

TEST_F(BroadcastTest, AnExtensionThatDiesOverAClipEndsTheBroadcastWithItsLastClip) {
  install(client_);
  setUp(client_, clipsOf(1));
  startBroadcast();
  play(100, 115);
  device_.extensions.complete(0, platform::Error{"d", 1, {}});
  device_.run();
  EXPECT_EQ(client_.takeEnds(), std::vector<int64_t>{errorcode::kInvalidBroadcastSession});
  ASSERT_EQ(device_.extensions.requests.size(), 2u);
  EXPECT_EQ(finishFlag(1), "1");
  EXPECT_EQ(openTransactions(), 0);
}

}  // namespace
}  // namespace qv
