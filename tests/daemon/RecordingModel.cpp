#include "tests/daemon/RecordingModel.h"

#include <cerrno>
#include <utility>

#include "support/QuorvelErrors.h"

namespace qv {

namespace {

bool all(const std::string&) { return true; }

/// A start that is refused so has not come to its file.
bool isRefusedBeforeItsFile(int64_t code) {
  static const std::set<int64_t> codes{errorcode::kUserDeclined, errorcode::kFailedToStart,
                                       errorcode::kInsufficientStorage, errorcode::kInvalidBroadcastSession,
                                       errorcode::kEntitlements};
  return codes.contains(code);
}

}  // namespace

void RecordingModel::doubt(App app, RequestID request, const std::function<bool(const std::string&)>& which) {
  for (auto& [name, movie] : apps_[app].movies) {
    if (which(name)) movie.doubts.insert(request);
  }
}

void RecordingModel::clear(App app, RequestID request) {
  for (auto& [name, movie] : apps_[app].movies) movie.doubts.erase(request);
}

RecordingModel::Movie* RecordingModel::find(App app, const std::string& name) {
  const auto it = apps_[app].movies.find(name);
  return it == apps_[app].movies.end() ? nullptr : &it->second;
}

void RecordingModel::startPosted(App app, RequestID request, bool makesMovie) {
  if (makesMovie) doubt(app, request, [](const std::string& name) { return !isTrimmed(name); });
}

void RecordingModel::startAnswered(App app, RequestID request, int64_t code, bool makesMovie) {
  if (code == 0) ++apps_[app].began;
  if (!makesMovie || isRefusedBeforeItsFile(code)) clear(app, request);
}

void RecordingModel::stopAnswered(App app, RequestID request, bool failed) {
  if (failed) clear(app, request);
  if (!failed) ++apps_[app].told;
}

void RecordingModel::handed(App app, const std::string& name, const std::string& content, bool isQuiet) {
  for (auto& [other, application] : apps_) {
    Movie* former = other == app ? nullptr : find(other, name);
    if (!former || former->isGone) continue;
    if (former->doubts.empty())
      fault("handed to " + std::to_string(app) + " and " + std::to_string(other) + ": " + name);
    former->isGone = true;
  }
  if (content.empty() && isQuiet) fault("handed but not there: " + name);
  apps_[app].movies[name] = {content, isQuiet ? std::set<RequestID>() : std::set{kForGood}, {}};
  apps_[app].last = name;
  apps_[app].mayHaveMissed = false;
}

void RecordingModel::savePosted(App app, RequestID request, const std::string& name) {
  Movie* movie = find(app, name);
  if (!movie) return;
  if (!movie->doubts.empty()) movie->lateSaves.insert(request);
  movie->doubts.insert(request);
}

void RecordingModel::saveAnswered(App app, RequestID request, const std::string& name, int64_t code,
                                  const std::string& saved) {
  Movie* movie = find(app, name);
  const bool isRight = movie && !movie->isGone;
  const bool wasCertain = isRight && movie->doubts == std::set{request} && !movie->lateSaves.contains(request);
  if (movie) movie->doubts.erase(request);
  if (code == 0) {
    if (!isRight && !apps_[app].hasLeft)
      fault("saved by " + std::to_string(app) + ", which has no right to it: " + name);
    if (wasCertain && !saved.empty() && saved != movie->content) fault("saved " + saved + " for " + movie->content);
    if (movie) movie->isGone = true;
  } else if (code != ENOSPC && wasCertain) {
    fault("not saved though it must be there, " + std::to_string(code) + ": " + name);
  }
}

void RecordingModel::discardPosted(App app, RequestID request, bool isQuiet) {
  const std::string last = apps_[app].last;
  const Movie* movie = find(app, last);
  const bool takesLast = isQuiet && movie && !movie->isGone && !apps_[app].mayHaveMissed;
  doubt(app, request, [&](const std::string& name) { return !takesLast || name == last; });
}

void RecordingModel::discardAnswered(App app, RequestID request, bool failed) {
  if (failed) clear(app, request);
  Movie* movie = find(app, apps_[app].last);
  if (!movie || movie->isGone || movie->doubts != std::set{request} || apps_[app].mayHaveMissed) return;
  movie->isGone = movie->isDiscarded = true;
}

void RecordingModel::purged() {
  for (const auto& [app, application] : apps_) doubt(app, kForGood, all);
}

void RecordingModel::connected(App app, bool isRecording) {
  apps_[app].began = isRecording ? 1 : 0;
  apps_[app].mayEndLate = !isRecording;
}

/// Its requests go unanswered: whatever was in doubt stays so.
void RecordingModel::left(App app) {
  apps_[app].hasLeft = apps_[app].mayHaveMissed = true;
  for (auto& [name, movie] : apps_[app].movies) {
    if (!movie.doubts.empty()) movie.doubts = {kForGood};
  }
}

void RecordingModel::checkMovies(const ContentAt& contentAt) {
  for (auto& [app, application] : apps_) {
    for (auto& [name, movie] : application.movies) {
      const bool isThere = contentAt(name) == movie.content;
      if (movie.isDiscarded && isThere) fault("discarded and still there: " + name);
      if (movie.isGone || !movie.doubts.empty()) continue;
      ++certainChecks_;
      if (!isThere) {
        fault("of " + std::to_string(app) + " and lost: " + name + ", " + movie.content + " became \"" +
              contentAt(name) + "\"");
      }
    }
  }
}

void RecordingModel::checkTold(App app, bool isRecording) {
  Application& application = apps_[app];
  int open = application.began - application.told;
  if (open < (isRecording ? 1 : 0) && std::exchange(application.mayEndLate, false)) {
    ++application.began;
    ++open;
  }
  if (open != (isRecording ? 1 : 0)) {
    fault(std::to_string(app) + " was told " + std::to_string(application.began) + " beginnings and " +
          std::to_string(application.told) + " ends, and records: " + std::to_string(isRecording));
  }
}

void RecordingModel::recordingAt(const std::string& name) {
  for (auto& [app, application] : apps_) {
    if (Movie* movie = find(app, name)) movie->isGone = true;
  }
}

bool RecordingModel::owns(const std::string& name, const std::string& content) const {
  for (const auto& [app, application] : apps_) {
    const auto movie = application.movies.find(name);
    if (movie == application.movies.end() || movie->second.isGone) continue;
    if (movie->second.content == content || movie->second.content.empty()) return true;
  }
  return false;
}

std::vector<std::string> RecordingModel::names(App app) const {
  std::vector<std::string> names;
  if (const auto it = apps_.find(app); it != apps_.end()) {
    for (const auto& [name, movie] : it->second.movies) names.push_back(name);
  }
  return names;
}

}  // namespace qv
