// The verbs that record, and bring movies out of the store: record, stop, save.

#include <poll.h>

#include <chrono>
#include <csignal>
#include <filesystem>

#include "tools/quorvelctl/DaemonStatus.h"
#include "tools/quorvelctl/RecorderLock.h"
#include "tools/quorvelctl/RecorderProcess.h"
#include "tools/quorvelctl/RecordingText.h"
#include "tools/quorvelctl/ScreenSize.h"
#include "tools/quorvelctl/Verbs.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;
using Clock = std::chrono::steady_clock;

namespace {

constexpr std::chrono::seconds kBetweenLooks{1};

std::string absolute(const std::string& path) { return std::filesystem::absolute(path).string(); }

/// What the program that records says, shown to whoever looks on.
///
/// Threading: one thread.
class Progress {
 public:
  Progress(const Stage& stage, RecorderProcess& recorder) : stage_(stage), recorder_(recorder) {}

  /// Until it has ended. What can no more be shown is remembered, and does not keep a movie from being saved.
  Exit follow() {
    while (!hasEnded_) {
      await();
      if (stage_.signals.take() || (until_ && Clock::now() >= *until_)) stop();
      if (hasNews_) take();
      attempt([this] { look(); });
    }
    if (failure_) throw *failure_;
    return saved_ ? Exit::Success : Exit::Failed;
  }

 private:
  void await() {
    auto wait = kBetweenLooks - (Clock::now() - looked_);
    if (until_) wait = std::min<Clock::duration>(wait, *until_ - Clock::now());
    const auto milliseconds = std::chrono::ceil<std::chrono::milliseconds>(wait).count();
    pollfd wanted[]{{recorder_.descriptor(), POLLIN, 0}, {stage_.signals.descriptor(), POLLIN, 0}};
    const bool hasLine = recorder_.hasLine();
    (void)::poll(wanted, 2, hasLine ? 0 : static_cast<int>(std::max<int64_t>(milliseconds, 0)));
    hasNews_ = hasLine || wanted[0].revents != 0;
  }
  void stop() {
    until_.reset();
    recorder_.stop();
  }
  void take() {
    const auto said = recorder_.next();
    if (!said) {
      hasEnded_ = true;
      if (!saved_ && !failure_)
        failure_ = Failure{Exit::Failed, "the program that records has died: see quorvelctl list"};
      return;
    }
    const std::string event = said->value("event", "");
    if (event == "failed") {
      failure_ = Failure{static_cast<Exit>(said->value("code", 1)), printable(said->value("text", ""))};
      return;
    }
    if (event == "saved") saved_ = true;
    if (event == "started") {
      isRunning_ = true;
      if (stage_.arguments.seconds) until_ = Clock::now() + lasting(*stage_.arguments.seconds);
    }
    attempt([&] { show(*said); });
  }
  static Clock::duration lasting(double seconds) {
    constexpr double kLongest = 1e8;  // some years
    return std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(std::min(seconds, kLongest)));
  }
  void show(const json& said) {
    const std::string event = said.value("event", "");
    if (stage_.arguments.json) return stage_.output.json(said);
    if (event == "started") {
      const bool lacks = stage_.arguments.microphone && !said.value("microphone", false);
      stage_.output.line(std::string("recording the screen") + (lacks ? ", without the microphone" : "") +
                         (stage_.output.isTerminal() ? "; Ctrl-C stops and saves" : ""));
    } else if (event == "broken") {
      stage_.output.keep();
      stage_.output.line("the recording has ended early: " + printable(said.value("text", "")));
    } else if (event == "saved") {
      stage_.output.keep();
      stage_.output.line(said.contains("path") ? "saved " + printable(said.value("path", "")) + ", " +
                                                     sizeText(said.value("bytes", uint64_t{0}))
                                               : "saved in the photo library");
    }
  }
  /// Once a second, where somebody looks on.
  void look() {
    if (Clock::now() - looked_ < kBetweenLooks) return;
    looked_ = Clock::now();
    if (!isRunning_ || saved_ || failure_ || !stage_.output.isTerminal() || stage_.arguments.json) return;
    try {
      stage_.output.redraw(lineOf(daemon_.recordings(), Output::columns() - 1));
    } catch (const Failure& failure) {
      // That it is gone is told by the program that records.
      if (failure.code == Exit::NotWritable) throw;
    }
  }
  void attempt(const std::function<void()>& writing) {
    if (isDeaf_) return;
    try {
      writing();
    } catch (const Failure& failure) {
      isDeaf_ = true;
      if (!failure_) failure_ = failure;
    }
  }

  const Stage& stage_;
  RecorderProcess& recorder_;
  DaemonStatus daemon_;
  std::optional<Clock::time_point> until_;
  Clock::time_point looked_{};
  bool hasNews_ = false, hasEnded_ = false, isRunning_ = false, saved_ = false, isDeaf_ = false;
  std::optional<Failure> failure_;
};

/// Why a start was refused, in the daemon's own words.
void addReasons(Failure& failure, bool microphone) {
  if (failure.code != Exit::Refused) return;
  try {
    DaemonStatus daemon;
    for (const json& each : daemon.startConditions(kOwnBundle, true, microphone)) {
      if (each.contains("code")) failure.text += " (" + printable(each.value("text", "")) + "; see quorvelctl doctor)";
    }
  } catch (const Failure&) {
    // Then the daemon's answer has to do.
  }
}

Exit follow(const Stage& stage, std::vector<std::string> words) {
  if (stage.arguments.output) words.push_back(absolute(*stage.arguments.output));
  RecorderProcess recorder(words);
  return Progress(stage, recorder).follow();
}

/// The newest that waits for this program, or the one of this name.
json waitingMovie(const std::optional<std::string>& name) {
  json found;
  DaemonStatus daemon;
  for (const json& movie : daemon.movies()) {
    const bool isOurs = movie.value("bundleIdentifier", "") == kOwnBundle && movie.value("state", "") == "waiting";
    if (!isOurs || (name && movie.value("name", "") != *name)) continue;
    if (found.is_null() || movie.value("modified", 0.0) > found.value("modified", 0.0)) found = movie;
  }
  if (found.is_null()) {
    throw Failure{Exit::Failed,
                  name ? "no movie named '" + printable(*name) + "' may be saved by quorvelctl: see quorvelctl list"
                       : "no movie waits to be saved by quorvelctl: see quorvelctl list"};
  }
  return found;
}

}  // namespace

Exit record(const Stage& stage) {
  if (const std::string why = whyUnreachable(); !why.empty()) throw Failure{Exit::NoDaemon, why};
  const auto [width, height] = stage.arguments.size.value_or(screenSize());
  try {
    return follow(stage,
                  {"record", std::to_string(width), std::to_string(height), stage.arguments.microphone ? "1" : "0"});
  } catch (Failure& failure) {
    addReasons(failure, stage.arguments.microphone);
    throw;
  }
}

/// A quorvelctl that records is told to stop, and saves its movie itself. What a dead one has left is ended here.
Exit stop(const Stage& stage) {
  if (const std::string why = whyUnreachable(); !why.empty()) throw Failure{Exit::NoDaemon, why};
  const auto holder = RecorderLock::holder();
  if (!holder) return follow(stage, {"finish"});
  if (stage.arguments.output) {
    throw Failure{Exit::Failed, "the quorvelctl that records saves its movie where it was told to: leave -o away"};
  }
  if (::kill(*holder, SIGINT) != 0) throw Failure{Exit::Failed, "the quorvelctl that records is somebody else's"};
  RecorderLock::awaitRelease();
  const json stopped{{"event", "stopped"}, {"process", *holder}};
  stage.arguments.json ? stage.output.json(stopped)
                       : stage.output.line("stopped; the quorvelctl that recorded has told where the movie is");
  return Exit::Success;
}

Exit save(const Stage& stage) {
  const auto& rest = stage.arguments.rest;
  const json movie = waitingMovie(rest.empty() ? std::nullopt : std::optional(rest.front()));
  return follow(stage, {"save", movie.value("movieURL", "")});
}

}  // namespace ctl
