#include "tools/quorvelctl/recorder/SystemRecorder.h"

#include <cstdio>
#include <utility>

namespace ctl {

using nlohmann::json;
using quorvel::Error;

namespace {

Exit exitFor(const Error& error) {
  if (error.domain != quorvel::kErrorDomain) return Exit::Failed;
  if (error.code == quorvel::kErrorConnectionInvalid) return Exit::NoDaemon;
  if (error.code == quorvel::kErrorConnectionInterrupted) return Exit::DaemonLost;
  return Exit::Refused;
}

}  // namespace

SystemRecorder::SystemRecorder(Loop& loop, std::unique_ptr<OutputFile> file)
    : loop_(loop), file_(std::move(file)), recorder_(quorvel::Recorder::create(options())) {}

quorvel::RecorderOptions SystemRecorder::options() {
  quorvel::RecorderOptions options;
  options.executor = [this](std::function<void()> work) { loop_.post(std::move(work)); };
  options.events.stopped = [this](const quorvel::StopResult& result) { ended(result); };
  return options;
}

void SystemRecorder::record(int width, int height, bool microphone) {
  const quorvel::StartOptions wanted{.width = static_cast<double>(width),
                                     .height = static_cast<double>(height),
                                     .microphone = microphone,
                                     .system = true};
  recorder_->currentState([this, wanted](const quorvel::StateResult& result) {
    if (result.error) return fail(*result.error, "");
    if (!result.state.recording) return start(wanted);
    fail({Exit::Failed, "a recording of a former quorvelctl goes on: end it by quorvelctl stop"});
  });
}

void SystemRecorder::start(const quorvel::StartOptions& wanted) {
  loop_.whenToEnd([this] { stop(); });
  recorder_->start(wanted, [this](const quorvel::StartResult& result) {
    if (result.error) return fail(*result.error, "the recording did not start: ");
    say({{"event", "started"}, {"microphone", result.microphone}});
  });
}

void SystemRecorder::stop() {
  recorder_->stop([this](const quorvel::StopResult& result) { ended(result); });
}

void SystemRecorder::finish() {
  recorder_->currentState([this](const quorvel::StateResult& result) {
    if (result.error) return fail(*result.error, "");
    if (result.state.recording && result.state.systemRecording) return stop();
    fail({Exit::Failed, "quorvelctl records nothing"});
  });
}

/// By this program, or by somebody else: the daemon's end, a full disk, another recording.
void SystemRecorder::ended(const quorvel::StopResult& result) {
  if (std::exchange(isEnding_, true)) return;
  if (result.error) say({{"event", "broken"}, {"text", result.error->text}});
  if (!result.movieURL.empty()) return deliver(result.movieURL, true);
  if (!result.error) return fail({Exit::Failed, "nothing was recorded"});
  const bool isLost = result.error->code == quorvel::kErrorConnectionInterrupted;
  const std::string where =
      isLost ? "; what was recorded stays in the store: see quorvelctl list when the daemon runs again"
             : "; where there is a movie, it is in the photo library";
  fail({isLost ? Exit::DaemonLost : Exit::Failed, "the recording has ended: " + result.error->text + where});
}

void SystemRecorder::save(const std::string& movieURL) { deliver(movieURL, false); }

void SystemRecorder::deliver(const std::string& movieURL, bool isNewest) {
  if (!file_) return putIntoLibrary(movieURL);
  recorder_->openMovie(
      movieURL, [this, isNewest](const quorvel::OpenMovieResult& movie) { guarded([&] { copy(movie, isNewest); }); });
}

/// The movie stays in the store until it is safe elsewhere.
void SystemRecorder::copy(const quorvel::OpenMovieResult& movie, bool isNewest) {
  if (movie.error) return fail(*movie.error, "the movie cannot be opened: ");
  uint64_t bytes = 0;
  try {
    bytes = file_->fillFrom(movie.file);
  } catch (const Failure& failure) {
    throw Failure{failure.code,
                  failure.text + "; the movie waits in the store: make room, then quorvelctl save -o FILE"};
  }
  say({{"event", "saved"}, {"path", file_->path()}, {"bytes", bytes}});
  if (!isNewest) return loop_.quit();
  recorder_->discard([this](const std::optional<Error>&) { loop_.quit(); });
}

void SystemRecorder::putIntoLibrary(const std::string& movieURL) {
  recorder_->saveVideoToCameraRoll(movieURL, [this](const std::optional<Error>& error) {
    if (error) return fail(*error, "the photo library does not take the movie, which waits in the store: ");
    say({{"event", "saved"}, {"library", true}});
    loop_.quit();
  });
}

/// Nobody may be there to hear it: the movie is saved all the same.
void SystemRecorder::say(const json& line) {
  std::printf("%s\n", line.dump(-1, ' ', false, json::error_handler_t::replace).c_str());
  std::fflush(stdout);
}

void SystemRecorder::guarded(const std::function<void()>& work) {
  try {
    work();
  } catch (const Failure& failure) {
    fail(failure);
  }
}

void SystemRecorder::fail(const Failure& failure) {
  say({{"event", "failed"}, {"code", static_cast<int>(failure.code)}, {"text", failure.text}});
  loop_.quit();
}

void SystemRecorder::fail(const Error& error, const std::string& what) { fail({exitFor(error), what + error.text}); }

}  // namespace ctl
