#include "Game.h"

#include <unistd.h>

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <utility>

#include "Scene.h"

namespace comet {

namespace {

using namespace std::chrono_literals;

/// A device takes a moment to see which application has come to the front.
constexpr auto kTimeToComeToFront = 200ms;
constexpr auto kLongestWaitForFocus = 3s;

}  // namespace

Game::Game(MainLoop& loop, const Options& options) : loop_(loop), options_(options) {
  if (!options.headless) {
    window_ = Window::create(options.width, options.height, options.title.c_str(),
                             {.key = [this](char key) { handleKey(key); },
                              .active = [this](bool active) { setActive(active); },
                              .exposed = [this] { shown_ = false; },
                              .closed = [this] { loop_.quit(); }});
    if (!window_) {
      std::printf("error code=0 text=no usable display; try --headless\n");
      ok_ = false;
      loop_.quit();
      return;
    }
    loop_.watch(window_->descriptor(), [this] { window_->dispatch(); });
    loop_.everyFrame(options.framesPerSecond, [this](Instant frame, Instant next) { showFrame(frame, next); });
  }
  recorder_ = quorvel::Recorder::create(recorderOptions());
  if (window_) {
    loop_.at(now() + kLongestWaitForFocus, [this] { begin(); });
  } else {
    setActive(true);
  }
}

void Game::setActive(bool active) {
  active ? recorder_->didBecomeActive() : recorder_->didResignActive();
  if (active && !begun_) loop_.at(now() + kTimeToComeToFront, [this] { begin(); });
}

/// Only an application that is in front may start a recording, so this waits for the focus.
void Game::begin() {
  begun_ = true;
  stepEnd_ = now();
  if (!options_.start) return nextStep();
  scriptWaits_ = true;
  start(options_.capture);
}

// Recording -----------------------------------------------------------------------------------------

/// Everything that the library tells us runs in the main loop, like the rest of the game.
quorvel::RecorderOptions Game::recorderOptions() {
  quorvel::RecorderOptions options;
  options.executor = [this](std::function<void()> work) { loop_.post(std::move(work)); };
  options.events.stopped = [this](const quorvel::StopResult& result) { stopped(result); };
  options.events.interrupted = [] { std::printf("interrupted\n"); };
  options.events.videoFrame = [this](const quorvel::VideoFrame& frame) { captured(frame); };
  options.events.audioSample = [this](const quorvel::AudioSample& sample) {
    ++(sample.source == quorvel::AudioSample::Source::Microphone ? microphoneSamples_ : audioSamples_);
  };
  listenToBroadcast(options.events);
  return options;
}

void Game::start(bool capture) {
  capturing_ = capture;
  videoFrames_ = audioSamples_ = microphoneSamples_ = 0;
  latencies_.clear();
  if (options_.broadcast.empty() || capture) return startRecording();
  setUpBroadcast();
}

void Game::startRecording() {
  // Without a window a device's headless screen knows us by our process.
  const uint32_t context = window_ ? window_->identifier() : static_cast<uint32_t>(::getpid());
  recorder_->start({.windows = {context},
                    .width = static_cast<double>(options_.width),
                    .height = static_cast<double>(options_.height),
                    .microphone = options_.microphone,
                    .broadcast = !options_.broadcast.empty() && !capturing_,
                    .capture = capturing_},
                   [this](const quorvel::StartResult& result) { started(result); });
}

void Game::started(const quorvel::StartResult& result) {
  if (result.error) {
    report(*result.error);
    return failScript();
  }
  recording_ = true;
  paused_ = false;
  microphone_ = result.microphone;
  std::printf("started microphone=%d camera=%d\n", result.microphone, result.camera);
  answered();
}

void Game::pauseOrResume() {
  if (!recording_) return;
  const auto onFailure = [this](const quorvel::Error& error) { report(error); };
  paused_ = !paused_;
  if (paused_) {
    recorder_->pause(onFailure);
  } else {
    recorder_->resume(window_ ? window_->identifier() : static_cast<uint32_t>(::getpid()), onFailure);
  }
  std::printf("%s\n", paused_ ? "paused" : "resumed");
}

void Game::stop() {
  auto handler = [this](const quorvel::StopResult& result) {
    stopped(result);
    if (result.error) return failScript();
    if (options_.keep.empty() || result.movieURL.empty()) return answered();
    keepMovie(result.movieURL);
  };
  if (options_.startClip == 0 && options_.endClip == 0) return recorder_->stop(std::move(handler));
  recorder_->stop({std::chrono::duration<double>(options_.startClip), std::chrono::duration<double>(options_.endClip)},
                  std::move(handler));
}

/// After our own stop, or because the recording ended by itself.
void Game::stopped(const quorvel::StopResult& result) {
  if (capturing_ && recording_) printCaptured();
  recording_ = false;
  movieURL_ = result.movieURL;
  std::printf("stopped url=%s error=%" PRId64 "\n", result.movieURL.c_str(), result.error ? result.error->code : 0);
  if (result.error) report(*result.error);
}

void Game::save() {
  recorder_->saveVideoToCameraRoll(movieURL_, [this](const std::optional<quorvel::Error>& error) {
    if (error) {
      report(*error);
      return failScript();
    }
    std::printf("saved\n");
    answered();
  });
}

void Game::discard() {
  recorder_->discard([this](const std::optional<quorvel::Error>& error) {
    if (error) {
      report(*error);
      return failScript();
    }
    std::printf("discarded\n");
    answered();
  });
}

void Game::toggleMicrophone() {
  microphone_ = !microphone_;
  recorder_->setMicrophoneEnabled(microphone_, [this](const quorvel::Error& error) { report(error); });
  std::printf("microphone enabled=%d\n", microphone_);
}

/// A real application would use the picture here; `frame` goes back to the daemon on return.
void Game::captured(const quorvel::VideoFrame& frame) {
  ++videoFrames_;
  latencies_.push_back(std::chrono::duration<double, std::milli>(now() - frame.presentationTime).count());
}

void Game::printCaptured() {
  std::sort(latencies_.begin(), latencies_.end());
  const double median = latencies_.empty() ? 0 : latencies_[latencies_.size() / 2];
  std::printf("captured video=%" PRIu64 " audio=%" PRIu64 " microphone=%" PRIu64 " latency_ms=%.1f dropped=%" PRIu64
              "\n",
              videoFrames_, audioSamples_, microphoneSamples_, median, recorder_->droppedSamples());
}

void Game::report(const quorvel::Error& error) {
  std::printf("error code=%" PRId64 " text=%s\n", error.code, error.text.c_str());
}

// The game ------------------------------------------------------------------------------------------

void Game::handleKey(char key) {
  switch (key) {
    case 'r':
      return start(options_.capture);
    case 'c':
      return start(true);
    case 'p':
      return pauseOrResume();
    case 's':
      return stop();
    case 'd':
      return discard();
    case 'm':
      return toggleMicrophone();
    case 'q':
      return loop_.quit();
    default:
      return;
  }
}

void Game::drawAhead(Instant frame) {
  const auto pixels = window_->backBuffer();
  if (pixels.empty()) return;
  const Instant shown = options_.still ? Instant(0) : frame;
  drawScene(pixels, options_.width, options_.height, shown, !options_.still && isFlash(shown), options_.sky);
  if (options_.numbered) drawNumber(pixels, options_.width, options_.height, ++number_);
  drawn_ = true;
  drawnFor_ = frame;
}

/// The picture for `frame` was drawn before, so that it is shown at its instant; then the next is drawn.
void Game::showFrame(Instant frame, Instant next) {
  if (options_.still && shown_) return;
  if (!drawn_ || drawnFor_ != frame) drawAhead(frame);
  if (!drawn_) return;  // the server is behind: this frame is left out
  window_->present();
  shown_ = true;
  drawn_ = false;
  if (!options_.still) drawAhead(next);
}

// The script ----------------------------------------------------------------------------------------

/// The times of the steps add up from the last answer, so that a late step does not delay the next.
void Game::wait(Instant duration, std::function<void()> then) {
  stepEnd_ += duration;
  loop_.at(stepEnd_, std::move(then));
}

void Game::answered() {
  if (!std::exchange(scriptWaits_, false)) return;
  stepEnd_ = now();
  nextStep();
}

void Game::failScript() {
  ok_ = false;
  scriptWaits_ = false;
  if (!options_.script.empty()) loop_.quit();
}

void Game::nextStep() {
  if (step_ >= options_.script.size()) return;
  const Step& step = options_.script[step_];
  const bool captures = step.kind == Step::Kind::Capture;
  if (captures ? !(recording_ && capturing_) : step.kind == Step::Kind::Record && !recording_) {
    // The step begins again when the recording has started.
    scriptWaits_ = true;
    return start(captures || options_.capture);
  }
  ++step_;
  const auto goOn = [this] { nextStep(); };
  const auto stopThenGoOn = [this] {
    scriptWaits_ = true;
    stop();
  };
  switch (step.kind) {
    case Step::Kind::Record:
      if (paused_) pauseOrResume();
      return wait(step.duration, goOn);
    case Step::Kind::Pause:
      if (!paused_) pauseOrResume();
      return wait(step.duration, goOn);
    case Step::Kind::Wait:
      return wait(step.duration, goOn);
    case Step::Kind::Capture:
      return wait(step.duration, stopThenGoOn);
    case Step::Kind::Stop:
      return stopThenGoOn();
    case Step::Kind::Save:
      scriptWaits_ = true;
      return save();
    case Step::Kind::Discard:
      scriptWaits_ = true;
      return discard();
    case Step::Kind::Quit:
      return loop_.quit();
  }
}

}  // namespace comet
