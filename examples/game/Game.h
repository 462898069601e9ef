#pragma once

#include <quorvel/Recorder.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "MainLoop.h"
#include "Options.h"
#include "Window.h"

namespace comet {

/// The game and its recording: this file, Game.cpp, Game_broadcast.cpp and Game_movie.cpp are the example of the client
/// library's use.
///
/// Says what happens in lines on standard output, for people and for scripts.
class Game {
 public:
  Game(MainLoop& loop, const Options& options);
  /// Whether everything that was asked for went well.
  [[nodiscard]] bool ok() const { return ok_; }

 private:
  // Recording
  quorvel::RecorderOptions recorderOptions();
  void start(bool capture);
  void startRecording();
  void started(const quorvel::StartResult& result);
  void pauseOrResume();
  void stop();
  void stopped(const quorvel::StopResult& result);
  void save();
  void keepMovie(const std::string& url);
  void discard();
  void toggleMicrophone();
  void captured(const quorvel::VideoFrame& frame);
  void printCaptured();
  void report(const quorvel::Error& error);

  // Broadcasts
  void setUpBroadcast();
  void listenToBroadcast(quorvel::Events& events);

  // The game
  void begin();
  void setActive(bool active);
  void handleKey(char key);
  void drawAhead(Instant frame);
  void showFrame(Instant frame, Instant next);

  // The script
  void nextStep();
  void wait(Instant duration, std::function<void()> then);
  void answered();
  void failScript();

  MainLoop& loop_;
  const Options options_;
  std::unique_ptr<Window> window_;
  bool shown_ = false;  // something, since the window was last exposed
  bool drawn_ = false;  // the back buffer holds the next frame
  Instant drawnFor_{0};
  uint32_t number_ = 0;  // of the picture drawn last

  bool recording_ = false, paused_ = false, capturing_ = false, microphone_ = false, ok_ = true;
  uint64_t videoFrames_ = 0, audioSamples_ = 0, microphoneSamples_ = 0;
  std::string movieURL_;           // of the movie that the last stop gave
  std::vector<double> latencies_;  // milliseconds from capture to arrival, of each frame

  bool begun_ = false;
  bool scriptWaits_ = false;  // for an answer
  size_t step_ = 0;
  Instant stepEnd_{0};

  /// Last, so that it goes first: no handler runs on a game that is half gone.
  std::unique_ptr<quorvel::Recorder> recorder_;
};

}  // namespace comet
