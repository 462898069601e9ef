#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace qv {

/// What the daemon's answers and messages oblige it to, as its clients see it: whose each movie is, whether it must be
/// there, and which recordings were told their end.
///
/// Movies go by the names of their files. One is in doubt while a request is on its way that may take it, and for good
/// once one has been answered that may have taken it. Of a movie in doubt nothing is asked but that nobody else gets
/// it.
class RecordingModel {
 public:
  using App = size_t;
  using RequestID = uint64_t;
  using ContentAt = std::function<std::string(const std::string& name)>;

  void startPosted(App app, RequestID request, bool makesMovie);
  void startAnswered(App app, RequestID request, int64_t code, bool makesMovie);
  void trimPosted(App app, RequestID request) { doubt(app, request, isTrimmed); }
  /// With `failed` nothing was recording.
  void stopAnswered(App app, RequestID request, bool failed);
  void endTold(App app) { ++apps_[app].told; }
  /// A movie was handed over. `isQuiet`: nothing is on its way that may take it.
  void handed(App app, const std::string& name, const std::string& content, bool isQuiet);
  void savePosted(App app, RequestID request, const std::string& name);
  /// `saved`: what reached the library, where that is known.
  void saveAnswered(App app, RequestID request, const std::string& name, int64_t code, const std::string& saved);
  void discardPosted(App app, RequestID request, bool isQuiet);
  void discardAnswered(App app, RequestID request, bool failed);
  /// The store was purged of all, or of what is old.
  void purged();
  /// A client went; whether it records when it comes back is asked anew.
  void arrived(App app) { apps_[app].began = apps_[app].told = 0; }
  void connected(App app, bool isRecording);
  void left(App app);

  /// With nothing under way: what must be there is, and what was discarded is not.
  void checkMovies(const ContentAt& contentAt);
  void checkTold(App app, bool isRecording);
  /// A recording is writing there, so it is nobody's former movie any more.
  void recordingAt(const std::string& name);
  [[nodiscard]] bool owns(const std::string& name, const std::string& content) const;
  [[nodiscard]] std::vector<std::string> names(App app) const;
  /// Whether it was away for a time, so that movies may be its own which it was never told of.
  [[nodiscard]] bool hasLeft(App app) const { return apps_.contains(app) && apps_.at(app).hasLeft; }

  void fault(const std::string& text) { faults_.push_back(text); }
  [[nodiscard]] const std::vector<std::string>& faults() const { return faults_; }
  [[nodiscard]] size_t certainChecks() const { return certainChecks_; }

 private:
  struct Movie {
    std::string content;
    std::set<RequestID> doubts;
    std::set<RequestID> lateSaves;  ///< asked while something else was on its way: refused with right
    bool isGone = false, isDiscarded = false;
  };
  struct Application {
    int began = 0, told = 0;
    bool mayEndLate = false;              ///< of what was ending when it came back
    bool mayHaveMissed = false;           ///< a movie that was handed to it while it was away
    std::map<std::string, Movie> movies;  ///< by file name
    std::string last;                     ///< handed last
    bool hasLeft = false;                 ///< what it was handed meanwhile, it was never told
  };
  static constexpr RequestID kForGood = 0;

  static bool isTrimmed(const std::string& name) { return name.find("_trimmed") != std::string::npos; }
  void doubt(App app, RequestID request, const std::function<bool(const std::string&)>& which);
  void clear(App app, RequestID request);
  Movie* find(App app, const std::string& name);

  std::map<App, Application> apps_;
  std::vector<std::string> faults_;
  size_t certainChecks_ = 0;
};

}  // namespace qv
