#include "SystemUI.h"

#include <unistd.h>

#include <cinttypes>
#include <cstdio>
#include <utility>

namespace screen {

namespace {

using namespace std::chrono_literals;

constexpr char kHelp[] =
    "commands: start, start microphone, stop, save, discard, microphone on, microphone off, state, quit\n";

}  // namespace

SystemUI::SystemUI(comet::MainLoop& loop, ScreenSize screen)
    : loop_(loop),
      screen_(screen),
      isTerminal_(::isatty(STDOUT_FILENO) != 0),
      console_({.line = [this](const std::string& line) { run(line); }, .ended = [this] { loop_.quit(); }}) {
  recorder_ = quorvel::Recorder::create(recorderOptions());
  recorder_->keepConnected(true);
  loop_.watch(STDIN_FILENO, [this] { console_.read(); });
  if (isTerminal_) std::printf("%s", kHelp);
}

quorvel::RecorderOptions SystemUI::recorderOptions() {
  quorvel::RecorderOptions options;
  options.executor = [this](std::function<void()> work) { loop_.post(std::move(work)); };
  // Also after the daemon was started anew; and a former run of this program may have begun a recording.
  options.events.connected = [this] { askState(); };
  options.events.interrupted = [this] {
    if (std::exchange(recording_, false)) std::printf("lost: the daemon went away\n");
  };
  // Another application's start, or the device, ended it: its movie is in the photo library.
  options.events.stopped = [this](const quorvel::StopResult& result) { recordingEnded(result, "ended"); };
  return options;
}

void SystemUI::run(const std::string& command) {
  if (command == "start") {
    start(false);
  } else if (command == "start microphone") {
    start(true);
  } else if (command == "stop") {
    stop();
  } else if (command == "save") {
    save();
  } else if (command == "discard") {
    discard();
  } else if (command == "microphone on" || command == "microphone off") {
    setMicrophone(command.ends_with("on"));
  } else if (command == "state") {
    askState();
  } else if (command == "quit") {
    loop_.quit();
  } else if (!command.empty()) {
    std::printf("%s", kHelp);
  }
}

void SystemUI::start(bool microphone) {
  recorder_->start({.width = screen_.width, .height = screen_.height, .microphone = microphone, .system = true},
                   [this](const quorvel::StartResult& result) {
                     if (result.error) return report(*result.error);
                     std::printf("started microphone=%d\n", result.microphone);
                     recordingBegan(comet::now());
                   });
}

void SystemUI::stop() {
  recorder_->stop([this](const quorvel::StopResult& result) { recordingEnded(result, "stopped"); });
}

void SystemUI::save() {
  recorder_->saveVideoToCameraRoll(std::exchange(movie_, {}), [this](const std::optional<quorvel::Error>& error) {
    if (error) return report(*error);
    std::printf("saved\n");
  });
}

void SystemUI::discard() {
  recorder_->discard([this](const std::optional<quorvel::Error>& error) {
    if (error) return report(*error);
    movie_.clear();
    std::printf("discarded\n");
  });
}

void SystemUI::setMicrophone(bool enabled) {
  recorder_->setMicrophoneEnabled(enabled, [this](const quorvel::Error& error) { report(error); });
}

void SystemUI::askState() {
  recorder_->currentState([this](const quorvel::StateResult& result) {
    if (result.error) return report(*result.error);
    const bool isRecording = result.state.recording && result.state.systemRecording;
    std::printf("state recording=%d microphone=%d\n", isRecording, result.state.microphoneEnabled);
    if (isRecording && !recording_) recordingBegan(comet::now());
    recording_ = isRecording;
  });
}

void SystemUI::recordingBegan(comet::Instant since) {
  recording_ = true;
  since_ = since;
  if (isTerminal_) showElapsed();
}

void SystemUI::recordingEnded(const quorvel::StopResult& result, const char* how) {
  recording_ = false;
  movie_ = result.movieURL;
  std::printf("%s%s url=%s error=%" PRId64 "\n", isTerminal_ ? "\r" : "", how, result.movieURL.c_str(),
              result.error ? result.error->code : 0);
  if (result.error) report(*result.error);
}

void SystemUI::showElapsed() {
  if (!recording_) return;
  const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(comet::now() - since_).count();
  std::printf("\rrecording %" PRId64 ":%02" PRId64 " ", static_cast<int64_t>(seconds / 60),
              static_cast<int64_t>(seconds % 60));
  std::fflush(stdout);
  loop_.at(since_ + (seconds + 1) * 1s, [this] { showElapsed(); });
}

void SystemUI::report(const quorvel::Error& error) {
  std::printf("error code=%" PRId64 " text=%s\n", error.code, error.text.c_str());
}

}  // namespace screen
