#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "Script.h"

namespace comet {

struct Options {
  uint32_t width = 1280, height = 720;
  int framesPerSecond = 60;
  bool start = false;       ///< start recording at once
  bool capture = false;     ///< recordings are captures: the samples come to us
  bool microphone = false;  ///< ask for the microphone
  bool sound = true;
  bool still = false;  ///< an unmoving picture
  bool headless = false;
  std::vector<Step> script;
};

/// Reads the command line. On a mistake it says so on standard error and ends the program.
Options parseOptions(int argc, char** argv);

}  // namespace comet
