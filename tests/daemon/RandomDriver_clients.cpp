#include <algorithm>

#include "protocol/QVBroadcastProtocols.h"
#include "tests/daemon/RandomDriver.h"

namespace qv {

using platform::Dictionary;
using platform::Value;

const std::vector<RandomDriver::Step>& RandomDriver::clientSteps() {
  using D = RandomDriver;
  static const std::vector<Step> all{
      {8, "start", [](D& d) { d.start(d.pickApp()); }},
      {10, "stop", [](D& d) { d.post(d.pickRecordingApp(), Kind::Stop, "stopRecordingWithHandler"); }},
      {5, "stopTrimmed",
       [](D& d) {
         d.post(d.pickRecordingApp(), Kind::StopTrimmed, "stopRecordingWithStartClipDuration",
                {Value(1.0), Value(1.0)});
       }},
      {10, "save",
       [](D& d) {
         const App app = d.pickApp();
         d.save(app, app);
       }},
      {2, "saveOfAnother",
       [](D& d) {
         const App owner = d.pickApp();
         d.save(d.pickApp(), owner);
       }},
      {4, "discard", [](D& d) { d.post(d.pickApp(), Kind::Discard, "discardRecordingWithHandler"); }},
      {3, "pause", [](D& d) { d.tell(d.pickRecordingApp(), "pauseRecording"); }},
      {4, "resume",
       [](D& d) {
         const App app = d.pickRecordingApp();
         // Now and then with the window of another.
         const App owner = d.chance(90) ? app : d.pickApp();
         d.tell(app, "resumeRecordingWithWindowLayerContextID", {Value(d.actors_[owner].context)});
       }},
      {4, "setUpBroadcast",
       [](D& d) {
         const App app = d.chance(50) ? kGame : kChat;
         const std::string& host = d.actors_[app].bundleID;
         d.post(app, Kind::SetUp, "setupBroadcastWithHostBundleID",
                {Value(host), Value(host + ".setup"), Value(QVBroadcastConfiguration{1, {}}.encode()),
                 Value(Dictionary{})});
       }},
      {3, "changeSound",
       [](D& d) {
         const App app = d.pickRecordingApp();
         if (d.chance(50)) return d.tell(app, "setMicrophoneEnabled", {Value(d.chance(50))});
         d.tell(app, "updateProcessIDForAudioCaptureWithPID", {Value(int32_t{d.chance(50) ? d.actors_[app].pid : 0})});
       }},
      {2, "reconnect",
       [](D& d) {
         const App app = d.pickApp();
         d.leave(app);
         if (d.chance(50)) d.runPieces(static_cast<int>(d.pick(4)));
         d.connect(app, false);
       }},
      {1, "goAway", [](D& d) { d.leave(d.pickApp()); }}};
  return all;
}

void RandomDriver::connect(App app, bool waits) {
  Actor& actor = actors_[app];
  Dictionary entitlements;
  if (app == kSystem) entitlements.emplace("com.tarnwick.private.quorvel", Value(true));
  actor.client = std::make_unique<TestClient>(device_, actor.bundleID, actor.pid, entitlements, waits);
  // What a former connection began goes on without it, if at all: from here on its end is told to this one.
  model_.arrived(app);
  const auto state = actor.client->post("synchronousGetCurrentState");
  runPieces(-1);
  model_.connected(app, *state && valueForKey((*state)->values.at(0).asDictionary(), "isRecording").asBool());
}

void RandomDriver::leave(App app) {
  trace("  " + std::to_string(app) + " leaves");
  Actor& actor = actors_[app];
  if (!actor.client) return;
  const auto waits = [app](const Request& request) { return request.app == app; };
  const bool isBusy = device_.executor.pending() > 0 || std::any_of(requests_.begin(), requests_.end(), waits);
  actor.client->leave();
  actor.client.reset();
  // A movie that was on its way to it has found nobody.
  if (isBusy || app == kSystem) abandonWhatIsOpen();
  std::erase_if(requests_, waits);
  model_.left(app);
}

void RandomDriver::tell(App app, const char* member, platform::IPCArguments arguments) {
  if (actors_[app].client) actors_[app].client->post(member, std::move(arguments));
}

void RandomDriver::post(App app, Kind kind, const char* member, platform::IPCArguments arguments,
                        const std::string& name, bool makesMovie) {
  if (!actors_[app].client) return;
  const uint64_t id = ++lastRequest_;
  trace("  " + std::to_string(app) + " asks #" + std::to_string(id) + " " + member + " " + name);
  if (kind == Kind::Start) model_.startPosted(app, id, makesMovie);
  if (kind == Kind::StopTrimmed) model_.trimPosted(app, id);
  if (kind == Kind::Save) model_.savePosted(app, id, name);
  if (kind == Kind::Discard) model_.discardPosted(app, id, !mayLose(app, {}));
  requests_.push_back({app, kind, id, makesMovie, name, actors_[app].client->post(member, std::move(arguments))});
}

void RandomDriver::start(App app) {
  TestClient::StartOptions options{.contexts = {actors_[app].context}, .microphone = chance(30)};
  options.system = app == kSystem && chance(90);
  options.capture = chance(12);
  options.broadcast = (app == kGame || app == kChat) && !options.capture && chance(35);
  if (options.broadcast && app == kGame && actors_[app].client) {
    extensions_.push_back(
        std::make_unique<fakes::FakeBroadcastExtension>(device_.ipc, device_.extensions, device_.executor));
  }
  post(app, Kind::Start, TestClient::kStart, TestClient::startArguments(options),
       options.capture     ? "a capture"
       : options.broadcast ? "a broadcast"
                           : "",
       !options.capture && !options.broadcast);
}

void RandomDriver::save(App app, App owner) {
  const auto names = model_.names(owner);
  if (names.empty()) return;
  const std::string& name = names[pick(names.size())];
  post(app, Kind::Save, "saveVideoToCameraRoll", {Value(actors_[owner].urls[name])}, name);
}

}  // namespace qv
