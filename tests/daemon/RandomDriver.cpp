#include "tests/daemon/RandomDriver.h"

#include <algorithm>

#include "extensions/AnswerDeadline.h"

namespace qv {

namespace {

constexpr int kStepsBetweenRests = 25;
constexpr int kEnoughRounds = 200;  ///< then something goes round for ever

std::string nameOf(const std::string& url) {
  const std::string path = platform::URL(url).path();
  return path.substr(path.rfind('/') + 1);
}

}  // namespace

RandomDriver::RandomDriver(uint64_t seed)
    : seed_(seed),
      actors_{{{"com.example.game", 100, 11, nullptr},
               {"com.example.namesake", 150, 12, nullptr},
               {"com.example.chat", 200, 13, nullptr},
               {"com.example.system", 300, 14, nullptr}}} {
  (void)namesake();
  (void)systemUI();
  device_.run();
  device_.deviceInfo.audioCaptureDevice = true;
  device_.extensions.install("com.example.game.upload", broadcastpoint::kUpload, "QVBroadcastProcessModeSampleBuffer");
  device_.extensions.install("com.example.chat.upload", broadcastpoint::kUpload);
  for (App app = 0; app < actors_.size(); ++app) {
    device_.applications.owners[actors_[app].context] = actors_[app].pid;
    connect(app, true);
  }
}

RandomDriver::~RandomDriver() {
  for (Actor& actor : actors_) actor.client.reset();
  for (const auto& session : device_.exports.sessions) session->end();
  device_.timers.advance(std::chrono::minutes(5));
  device_.run();
}

void RandomDriver::trace(const std::string& text) {
  trace_.push_back(text);
  if (trace_.size() > kTraceLength) trace_.pop_front();
}

bool RandomDriver::run(int steps) {
  static const auto wheel = [] {
    std::vector<Step> each;
    for (const auto* some : {&clientSteps(), &deviceSteps()}) {
      for (const Step& step : *some) each.insert(each.end(), step.weight, step);
    }
    return each;
  }();
  for (int done = 1; done <= steps && model_.faults().empty(); ++done) {
    const Step& step = wheel[pick(wheel.size())];
    trace(step.name);
    step.act(*this);
    runPieces(chance(40) ? -1 : static_cast<int>(pick(6)));
    device_.clock.advance(std::chrono::milliseconds(pick(700)));
    if (done % kStepsBetweenRests == 0 && model_.faults().empty()) settle();
  }
  return model_.faults().empty();
}

std::string RandomDriver::report() const {
  std::string text = "QUORVEL_RANDOM_SEED=" + std::to_string(seed_) + "\n";
  for (const std::string& line : trace_) text += line + "\n";
  for (const std::string& fault : model_.faults()) text += "FAULT: " + fault + "\n";
  return text;
}

/// Piece by piece, so that each answer and message is looked at when it comes.
void RandomDriver::runPieces(int count) {
  for (int done = 0; done != count && device_.executor.runOne(); ++done) poll();
  checkMoviesBeingWritten();
}

void RandomDriver::poll() {
  for (App app = 0; app < actors_.size(); ++app) {
    while (const auto end = actors_[app].client ? actors_[app].client->takeEnd() : std::nullopt) {
      trace("  " + std::to_string(app) + " is told " + std::to_string(end->code) + " " + end->movie);
      model_.endTold(app);
      if (!end->movie.empty()) takeHanded(app, end->movie);
    }
  }
  for (size_t i = 0; i < requests_.size();) {
    if (!*requests_[i].slot) {
      ++i;
      continue;
    }
    const Request request = requests_[i];
    requests_.erase(requests_.begin() + static_cast<std::ptrdiff_t>(i));
    resolve(request, **request.slot);
  }
}

void RandomDriver::resolve(const Request& request, const TestClient::Answer& answer) {
  const bool failed = answer.failure.has_value();
  const bool isStop = request.kind == Kind::Stop || request.kind == Kind::StopTrimmed;
  const int64_t code = answer.values.empty() ? 0 : answer.code(isStop ? 1 : 0);
  trace("  " + std::to_string(request.app) + " is answered #" + std::to_string(request.id) + ": " +
        (failed ? answer.failureName() : std::to_string(code)));
  if (answer.failureName() == fakes::kNoReplyErrorName) model_.fault("request " + std::to_string(request.id) + " lost");
  if (request.kind == Kind::Start) {
    if (code == 0) lastStarted_ = request.app;
    model_.startAnswered(request.app, request.id, code, request.makesMovie);
  } else if (isStop) {
    model_.stopAnswered(request.app, request.id, failed);
    const std::string movie = failed ? std::string() : answer.values.at(0).asString();
    if (code != 0 && !movie.empty()) model_.fault("an error and a movie");
    if (!movie.empty()) takeHanded(request.app, movie);
  } else if (request.kind == Kind::Save) {
    model_.saveAnswered(request.app, request.id, request.name, code, savedContent(request.name));
  } else if (request.kind == Kind::Discard) {
    model_.discardAnswered(request.app, request.id, failed);
  }
}

void RandomDriver::takeHanded(App app, const std::string& url) {
  const std::string name = nameOf(url);
  actors_[app].urls[name] = url;
  model_.handed(app, name, contentOf(name), !mayLose(app, name));
}

/// Whether something is on its way that may take a movie before its receiver looks at it.
bool RandomDriver::mayLose(App app, const std::string& name) const {
  return wasPurged_ || std::ranges::any_of(requests_, [&](const Request& request) {
           if (request.app != app) return false;
           if (request.kind == Kind::Save) return request.name == name;
           return request.makesMovie || request.kind == Kind::Discard;
         });
}

/// Of the newest mix of this movie; empty where it was saved as it was.
std::string RandomDriver::savedContent(const std::string& name) const {
  const auto& sessions = device_.exports.sessions;
  const auto mix = std::find_if(sessions.rbegin(), sessions.rend(), [&](const auto& session) {
    return session->preset == platform::ExportPreset::HighestQuality &&
           nameOf(session->source.absoluteString()) == name;
  });
  return mix == sessions.rend() ? std::string() : (*mix)->content;
}

void RandomDriver::checkMoviesBeingWritten() {
  const auto& movies = device_.movies.movies;
  for (size_t i = firstOpenMovie_; i < movies.size(); ++i) {
    // One that nobody else holds will never be written.
    const bool isOpen = movies[i].use_count() > 1 && (movies[i]->status == platform::AssetWriterStatus::Writing ||
                                                      movies[i]->status == platform::AssetWriterStatus::Unknown);
    if (!isOpen && i == firstOpenMovie_) ++firstOpenMovie_;
    if (!isOpen || movies[i]->status != platform::AssetWriterStatus::Writing) continue;
    const std::string name = nameOf(movies[i]->url.absoluteString());
    if (contentOf(name) != movies[i]->content) {
      model_.fault(movies[i]->content + " is being recorded, its file \"" + name + "\" holds \"" + contentOf(name) +
                   "\"");
    }
  }
}

/// Lets everybody finish who is still at something; the device answers what is asked of it.
void RandomDriver::settle() {
  trace("-- rest");
  device_.exports.holds = false;
  // An extension that does not answer keeps a start waiting for so long, and then an end.
  for (int waits = 0; waits < 3; ++waits) {
    int rounds = 0;
    do {
      runPieces(-1);
    } while (answerSomebody() && ++rounds < kEnoughRounds);
    if (rounds == kEnoughRounds) model_.fault("it does not come to rest");
    device_.timers.advance(kExtensionPatience);
  }
  runPieces(-1);
  checkRest();
  wasPurged_ = false;
  device_.log.clear();
  extensions_.erase(extensions_.begin(), extensions_.end() - std::min<std::ptrdiff_t>(1, std::ssize(extensions_)));
}

bool RandomDriver::answerSomebody() {
  if (std::ranges::any_of(device_.alerts.shown, [](auto& each) { return each->visible; })) {
    answerAlert();
    return true;
  }
  for (const auto& session : device_.exports.sessions) {
    if (!session->whenEnded) continue;
    session->end();
    return true;
  }
  if (answeredClips_ < device_.extensions.requests.size()) {
    answerClip();
    return true;
  }
  if (connectExtension()) return true;
  for (const Actor& actor : actors_) {
    if (actor.client) continue;
    connect(static_cast<App>(&actor - actors_.data()), false);
    return true;
  }
  return false;
}

void RandomDriver::checkRest() {
  for (const Request& request : requests_) {
    model_.fault("request " + std::to_string(request.id) + " of " + std::to_string(request.app) +
                 " was never answered");
  }
  model_.checkMovies([this](const std::string& name) { return contentOf(name); });
  int recording = 0;
  for (App app = 0; app < actors_.size(); ++app) {
    const bool isRecording = actors_[app].client->isRecording();
    poll();
    model_.checkTold(app, isRecording);
    recording += isRecording ? 1 : 0;
  }
  if (recording > 1) model_.fault("two record");
  if (openTransactions() != recording) {
    model_.fault(std::to_string(openTransactions()) + " transactions of " + std::to_string(recording) + " recordings");
  }
  checkSources(recording);
  checkStore();
}

void RandomDriver::checkSources(int recording) {
  if (recording == 0) {
    if (!areSourcesOff()) model_.fault("nothing is recorded, and a source is on");
    return;
  }
  if (chance(50)) return;
  for (App app = 0; app < actors_.size(); ++app) {
    const auto state = actors_[app].client->state();
    const bool broadcasts = valueForKey(state, "isBroadcasting").asBool();
    if (!valueForKey(state, "isRecording").asBool() || broadcasts) continue;
    actors_[app].client->post("resumeRecordingWithWindowLayerContextID", {platform::Value(actors_[app].context)});
    runPieces(-1);
    const bool isSeen = std::ranges::any_of(device_.screen.controllers, [](const auto* each) { return each->running; });
    if (!isSeen || device_.screen.mode == platform::DisplayCloneMode::Off) {
      model_.fault(std::to_string(app) + " records, and sees nothing");
    }
  }
}

/// Each file is somebody's: an application's movie, being written, or left by a recording that could not tell of it.
void RandomDriver::checkStore() {
  std::set<std::string> written;
  for (size_t i = firstOpenMovie_; i < device_.movies.movies.size(); ++i) {
    const auto& movie = *device_.movies.movies[i];
    if (movie.status != platform::AssetWriterStatus::Writing) continue;
    written.insert(nameOf(movie.url.absoluteString()));
    model_.recordingAt(nameOf(movie.url.absoluteString()));
  }
  const auto names = device_.disk.contentsOfDirectory(fakes::kStore);
  for (const std::string& name : names.value()) {
    const bool isMix = name.starts_with("QVQuorvel_Final");
    if (!isMix &&
        (written.contains(name) || model_.owns(name, contentOf(name)) || abandoned_.contains(contentOf(name)))) {
      continue;
    }
    // A system recording goes on without its client.
    if (name.starts_with("ScreenRecording_") && model_.hasLeft(kSystem)) continue;
    model_.fault("nobody's file: " + name + ", " + contentOf(name));
  }
}

bool RandomDriver::finish() {
  for (App app = 0; app < actors_.size(); ++app) {
    post(app, Kind::Stop, "stopRecordingWithHandler");
    runPieces(-1);
  }
  settle();
  for (App app = 0; app < actors_.size(); ++app) leave(app);
  runPieces(-1);
  device_.timers.advance(kExtensionPatience);
  runPieces(-1);
  if (openTransactions() != 0) model_.fault("a transaction is left");
  if (!areSourcesOff()) model_.fault("a source is left on");
  if (device_.timers.pending() != 0) model_.fault(std::to_string(device_.timers.pending()) + " timers are left");
  checkStore();
  return model_.faults().empty();
}

}  // namespace qv
