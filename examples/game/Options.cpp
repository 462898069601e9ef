#include "Options.h"

#include <getopt.h>

#include <cstdio>
#include <cstdlib>

namespace comet {

namespace {

constexpr char kUsage[] =
    "usage: quorvel-example-game [--size WxH] [--fps N] [--start] [--capture] [--microphone]\n"
    "                            [--no-sound] [--static] [--headless] [--script STEPS]\n"
    "                            [--title TEXT] [--sky RRGGBB] [--tone HZ] [--numbered]\n"
    "                            [--trim START,END] [--keep FILE]\n"
    "                            [--broadcast EXTENSION_ID [--broadcast-info KEY=VALUE]... [--clip-duration S]]\n"
    "steps, separated by \";\": record S, pause S, wait S, capture S, stop, save, discard, quit\n"
    "keys: r start, p pause and resume, s stop, d discard, c capture, m microphone, q quit\n";

[[noreturn]] void refuse(const char* what) {
  std::fprintf(stderr, "%s\n%s", what, kUsage);
  std::exit(2);
}

uint32_t colorFrom(const char* text) {
  char* end = nullptr;
  const unsigned long color = std::strtoul(text, &end, 16);
  if (end == text || *end != '\0' || color > 0xffffff) refuse("--sky wants RRGGBB");
  return static_cast<uint32_t>(color);
}

enum Option {
  kSize = 1,
  kFps,
  kStart,
  kCapture,
  kMicrophone,
  kNoSound,
  kStatic,
  kHeadless,
  kScript,
  kTitle,
  kSky,
  kTone,
  kBroadcast,
  kBroadcastInfo,
  kClipDuration,
  kNumbered,
  kTrim,
  kKeep,
  kHelp
};
constexpr option kOptions[] = {{"size", required_argument, nullptr, kSize},
                               {"fps", required_argument, nullptr, kFps},
                               {"start", no_argument, nullptr, kStart},
                               {"capture", no_argument, nullptr, kCapture},
                               {"microphone", no_argument, nullptr, kMicrophone},
                               {"no-sound", no_argument, nullptr, kNoSound},
                               {"static", no_argument, nullptr, kStatic},
                               {"headless", no_argument, nullptr, kHeadless},
                               {"script", required_argument, nullptr, kScript},
                               {"title", required_argument, nullptr, kTitle},
                               {"sky", required_argument, nullptr, kSky},
                               {"tone", required_argument, nullptr, kTone},
                               {"broadcast", required_argument, nullptr, kBroadcast},
                               {"broadcast-info", required_argument, nullptr, kBroadcastInfo},
                               {"clip-duration", required_argument, nullptr, kClipDuration},
                               {"numbered", no_argument, nullptr, kNumbered},
                               {"trim", required_argument, nullptr, kTrim},
                               {"keep", required_argument, nullptr, kKeep},
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
    case kTitle:
      options.title = optarg;
      break;
    case kSky:
      options.sky = colorFrom(optarg);
      break;
    case kTone:
      options.tone = std::atof(optarg);
      if (!(*options.tone >= 20 && *options.tone <= 20'000)) refuse("--tone wants 20 to 20000");
      break;
    case kBroadcast:
      options.broadcast = optarg;
      break;
    case kBroadcastInfo: {
      const std::string entry = optarg;
      const size_t end = entry.find('=');
      if (end == std::string::npos) refuse("--broadcast-info wants KEY=VALUE");
      options.broadcastInfo.emplace_back(entry.substr(0, end), entry.substr(end + 1));
      break;
    }
    case kClipDuration:
      options.clipDuration = std::atof(optarg);
      if (!(options.clipDuration > 0 && options.clipDuration <= 3600)) refuse("--clip-duration wants seconds");
      break;
    case kNumbered:
      options.numbered = true;
      break;
    case kTrim:
      if (std::sscanf(optarg, "%lf,%lf", &options.startClip, &options.endClip) != 2 || !(options.startClip >= 0) ||
          !(options.endClip >= 0))
        refuse("--trim wants START,END in seconds");
      break;
    case kKeep:
      options.keep = optarg;
      break;
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
