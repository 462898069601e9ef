#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
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
  std::string title = "Comet Run";
  std::optional<uint32_t> sky;  ///< 0xRRGGBB instead of the night's
  std::optional<double> tone;   ///< Hz, without end, instead of the beeps
  std::string broadcast;        ///< recordings go to this extension; empty: into movies
  std::vector<std::pair<std::string, std::string>> broadcastInfo;  ///< user information for it
  double clipDuration = 0;                                         ///< seconds; 0: as the daemon does
  bool numbered = false;                                           ///< each picture carries its number
  double startClip = 0, endClip = 0;                               ///< seconds that a stop trims off
  std::string keep;                                                ///< a stop copies its movie to this path
  std::vector<Step> script;
};

/// Reads the command line. On a mistake it says so on standard error and ends the program.
Options parseOptions(int argc, char** argv);

}  // namespace comet
