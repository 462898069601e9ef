#pragma once

#include <quorvel/Recorder.h>

#include <memory>
#include <optional>
#include <string>

#include "Console.h"
#include "MainLoop.h"

namespace screen {

struct ScreenSize {
  double width = 0, height = 0;
};

/// What a device's own interface does with the recorder: starts and stops a recording of the whole screen,
/// shows whether one runs and for how long, and keeps its movie. The recording does not need this
/// program: it goes on when the program ends, and is found again when it is started anew.
///
/// Threading: the main loop's thread.
class SystemUI {
 public:
  SystemUI(comet::MainLoop& loop, ScreenSize screen);

 private:
  quorvel::RecorderOptions recorderOptions();
  void run(const std::string& command);
  void start(bool microphone);
  void stop();
  void save();
  void discard();
  void setMicrophone(bool enabled);
  void askState();
  void recordingBegan(comet::Instant since);
  void recordingEnded(const quorvel::StopResult& result, const char* how);
  /// Once a second, while a person looks on.
  void showElapsed();
  void report(const quorvel::Error& error);

  comet::MainLoop& loop_;
  const ScreenSize screen_;
  const bool isTerminal_;
  Console console_;
  bool recording_ = false;
  comet::Instant since_{0};
  std::string movie_;  // of the last stop, until it is saved or discarded
  /// Last, so that it goes first.
  std::unique_ptr<quorvel::Recorder> recorder_;
};

}  // namespace screen
