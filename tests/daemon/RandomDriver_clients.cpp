#include <algorithm>

#include "extensions/QVBroadcastProtocols.h"
#include "tests/daemon/RandomDriver.h"

namespace qv {

using platform::Dictionary;
using platform::Value;

void RandomDriver::connect(App app, bool waits) {
  Actor& actor = actors_[app];
  Dictionary entitlements;
  if (app == kSystem) entitlements.emplace("com.tarnwick.private.quorvel", Value(true));
  actor.client = std::make_unique<TestClient>(device_, actor.bundleID, actor.pid, entitlements, waits);
  // What a former connection began goes on without it, if at all: from here on its end is told to this one.
  model_.connected(app, false);
  const auto state = actor.client->post("synchronousGetCurrentState");
  runPieces(-1);
  model_.connected(app, *state && valueForKey((*state)->values.at(0).asDictionary(), "isRecording").asBool());
}

void RandomDriver::leave(App app) {
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

void RandomDriver::post(App app, Kind kind, const char* member, platform::IPCArguments arguments,
                        const std::string& name) {
  TestClient* client = actors_[app].client.get();
  if (!client) return;
  trace("  " + std::to_string(app) + " asks #" + std::to_string(lastRequest_ + 1) + " " + member + " " + name);
  const uint64_t id = ++lastRequest_;
  requests_.push_back({app, kind, id, false, name, client->post(member, std::move(arguments))});
}

void RandomDriver::start() {
  const App app = pickApp();
  Actor& actor = actors_[app];
  if (!actor.client) return;
  TestClient::StartOptions options{.contexts = {actor.context}, .microphone = chance(30)};
  options.system = app == kSystem && chance(90);
  options.capture = chance(12);
  options.broadcast = (app == kGame || app == kChat) && !options.capture && chance(35);
  if (options.broadcast && app == kGame) {
    extensions_.push_back(
        std::make_unique<fakes::FakeBroadcastExtension>(device_.ipc, device_.extensions, device_.executor));
  }
  const uint64_t id = ++lastRequest_;
  const bool makesMovie = !options.capture && !options.broadcast;
  trace("  " + std::to_string(app) + " asks #" + std::to_string(id) + " start" + (options.capture ? " capture" : "") +
        (options.broadcast ? " broadcast" : ""));
  model_.startPosted(app, id, makesMovie);
  requests_.push_back({app, Kind::Start, id, makesMovie, {}, actor.client->postStart(options)});
}

void RandomDriver::stop() { post(pickRecordingApp(), Kind::Stop, "stopRecordingWithHandler", {}); }

void RandomDriver::stopTrimmed() {
  const App app = pickRecordingApp();
  if (!actors_[app].client) return;
  model_.stopPosted(app, lastRequest_ + 1, true);
  post(app, Kind::Stop, "stopRecordingWithStartClipDuration", {Value(1.0), Value(1.0)});
}

void RandomDriver::save() {
  const App app = pickApp();
  const auto names = model_.names(app);
  if (names.empty()) return;
  const std::string& name = names[pick(names.size())];
  saveNamed(app, name, actors_[app].urls[name]);
}

void RandomDriver::saveOfAnother() {
  const App owner = pickApp();
  const App app = pickApp();
  const auto names = model_.names(owner);
  if (names.empty()) return;
  const std::string& name = names[pick(names.size())];
  saveNamed(app, name, actors_[owner].urls[name]);
}

void RandomDriver::saveNamed(App app, const std::string& name, const std::string& url) {
  if (!actors_[app].client) return;
  model_.savePosted(app, lastRequest_ + 1, name);
  post(app, Kind::Save, "saveVideoToCameraRoll", {Value(url)}, name);
}

void RandomDriver::discard() {
  const App app = pickApp();
  if (!actors_[app].client) return;
  model_.discardPosted(app, lastRequest_ + 1, !mayLose(app, {}));
  post(app, Kind::Discard, "discardRecordingWithHandler", {});
}

void RandomDriver::pause() {
  if (Actor& actor = actors_[pickRecordingApp()]; actor.client) actor.client->post("pauseRecording");
}

void RandomDriver::resume() {
  const App app = pickRecordingApp();
  if (!actors_[app].client) return;
  // Now and then with the window of another.
  const App owner = chance(90) ? app : pickApp();
  actors_[app].client->post("resumeRecordingWithWindowLayerContextID", {Value(actors_[owner].context)});
}

void RandomDriver::setUpBroadcast() {
  const App app = chance(50) ? kGame : kChat;
  const std::string& host = actors_[app].bundleID;
  post(app, Kind::SetUp, "setupBroadcastWithHostBundleID",
       {Value(host), Value(host + ".setup"), Value(QVBroadcastConfiguration{1, {}}.encode()), Value(Dictionary{})});
}

void RandomDriver::changeSound() {
  Actor& actor = actors_[pickRecordingApp()];
  if (!actor.client) return;
  if (chance(50)) {
    actor.client->post("setMicrophoneEnabled", {Value(chance(50))});
  } else {
    actor.client->post("updateProcessIDForAudioCaptureWithPID", {Value(int32_t{chance(50) ? actor.pid : 0})});
  }
}

void RandomDriver::reconnect() {
  const App app = pickApp();
  trace("  " + std::to_string(app));
  leave(app);
  if (chance(50)) runPieces(static_cast<int>(pick(4)));
  connect(app, false);
}

void RandomDriver::goAway() {
  const App app = pickApp();
  trace("  " + std::to_string(app));
  leave(app);
}

}  // namespace qv
