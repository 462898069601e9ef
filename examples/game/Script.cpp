#include "Script.h"

#include <array>
#include <cmath>
#include <sstream>
#include <string>

namespace comet {

namespace {

struct Verb {
  const char* name;
  Step::Kind kind;
  bool hasDuration;
};
constexpr std::array<Verb, 8> kVerbs = {{{"record", Step::Kind::Record, true},
                                         {"pause", Step::Kind::Pause, true},
                                         {"wait", Step::Kind::Wait, true},
                                         {"capture", Step::Kind::Capture, true},
                                         {"stop", Step::Kind::Stop, false},
                                         {"save", Step::Kind::Save, false},
                                         {"discard", Step::Kind::Discard, false},
                                         {"quit", Step::Kind::Quit, false}}};
constexpr double kLongestStep = 86'400;  // seconds

std::optional<Step> parseStep(const std::string& text) {
  std::istringstream words(text);
  std::string name, rest;
  words >> name;
  for (const Verb& verb : kVerbs) {
    if (name != verb.name) continue;
    double seconds = 0;
    if (verb.hasDuration && (!(words >> seconds) || !(seconds >= 0 && seconds <= kLongestStep))) return std::nullopt;
    if (words >> rest) return std::nullopt;
    return Step{verb.kind, std::chrono::nanoseconds(std::llround(seconds * 1e9))};
  }
  return std::nullopt;
}

}  // namespace

std::optional<std::vector<Step>> parseScript(std::string_view text) {
  std::vector<Step> steps;
  std::istringstream parts{std::string(text)};
  for (std::string part; std::getline(parts, part, ';');) {
    if (part.find_first_not_of(" \t\n") == std::string::npos) continue;
    const auto step = parseStep(part);
    if (!step) return std::nullopt;
    steps.push_back(*step);
  }
  return steps;
}

}  // namespace comet
