#include "Options.h"

#include <getopt.h>

#include <cstdio>
#include <cstdlib>

namespace comet {

namespace {

constexpr char kUsage[] =
    "usage: quorvel-example-game [--size WxH] [--fps N] [--start] [--capture] [--microphone]\n"
    "                            [--no-sound] [--static] [--headless] [--script STEPS]\n"
    "steps, separated by \";\": record S, pause S, wait S, capture S, stop, discard, quit\n"
    "keys: r start, p pause and resume, s stop, d discard, c capture, m microphone, q quit\n";

[[noreturn]] void refuse(const char* what) {
  std::fprintf(stderr, "%s\n%s", what, kUsage);
  std::exit(2);
}

enum Option { kSize = 1, kFps, kStart, kCapture, kMicrophone, kNoSound, kStatic, kHeadless, kScript, kHelp };
constexpr option kOptions[] = {{"size", required_argument, nullptr, kSize},
                               {"fps", required_argument, nullptr, kFps},
                               {"start", no_argument, nullptr, kStart},
                               {"capture", no_argument, nullptr, kCapture},
                               {"microphone", no_argument, nullptr, kMicrophone},
                               {"no-sound", no_argument, nullptr, kNoSound},
                               {"static", no_argument, nullptr, kStatic},
                               {"headless", no_argument, nullptr, kHeadless},
                               {"script", required_argument, nullptr, kScript},
                               {"help", no_argument, nullptr, kHelp},
                               {nullptr, 0, nullptr, 0}};

void apply(Options& options, int option) {
  switch (option) {
    case kSize:
      if (std::sscanf(optarg, "%ux%u", &options.width, &options.height) != 2 || options.width < 16 ||
          options.height < 16 || options.width > 16384 || options.height > 16384)
        refuse("--size wants WxH, each from 16 to 16384");
      break;
    case kFps:
      options.framesPerSecond = std::atoi(optarg);
      if (options.framesPerSecond < 1 || options.framesPerSecond > 240) refuse("--fps wants 1 to 240");
      break;
    case kStart:
      options.start = true;
      break;
    case kCapture:
      options.capture = true;
      break;
    case kMicrophone:
      options.microphone = true;
      break;
    case kNoSound:
      options.sound = false;
      break;
    case kStatic:
      options.still = true;
      break;
    case kHeadless:
      options.headless = true;
      break;
    case kScript: {
      auto script = parseScript(optarg);
      if (!script) refuse("--script has a step that is none");
      options.script = std::move(*script);
      break;
    }
    case kHelp:
      std::printf("%s", kUsage);
      std::exit(0);
    default:
      refuse("");
  }
}

}  // namespace

Options parseOptions(int argc, char** argv) {
  Options options;
  for (int option; (option = getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) apply(options, option);
  if (optind != argc) refuse("there are no other arguments");
  return options;
}

}  // namespace comet
