#include "tools/quorvelctl/Arguments.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <map>

#include "tools/quorvelctl/Failure.h"

namespace ctl {

namespace {

using Setter = std::function<void(Arguments&, const std::string& value)>;
struct Option {
  bool hasValue;
  std::string verbs;  ///< that have it, each between spaces
  Setter set;
};

[[noreturn]] void misused(const std::string& text) { throw Failure{Exit::Usage, text + "; see quorvelctl --help"}; }

double secondsFrom(const std::string& text) {
  char* end = nullptr;
  const double seconds = std::strtod(text.c_str(), &end);
  if (text.empty() || *end != '\0' || !std::isfinite(seconds) || seconds <= 0) {
    misused("--seconds takes a number above 0, not '" + text + "'");
  }
  return seconds;
}

std::pair<int, int> sizeFrom(const std::string& text) {
  int width = 0, height = 0, read = 0;
  if (std::sscanf(text.c_str(), "%dx%d%n", &width, &height, &read) != 2 || read != static_cast<int>(text.size()) ||
      width < 1 || height < 1) {
    misused("--size takes WIDTHxHEIGHT, not '" + text + "'");
  }
  return {width, height};
}

const std::map<std::string, Option>& options() {
  static const Setter setOutput = [](Arguments& a, const std::string& value) { a.output = value; };
  static const std::map<std::string, Option> all{
      {"--json",
       {false, " status watch record stop list save extensions metrics recover doctor ",
        [](Arguments& a, const std::string&) { a.json = true; }}},
      {"-o", {true, " record stop save ", setOutput}},
      {"--output", {true, " record stop save ", setOutput}},
      {"--seconds", {true, " record ", [](Arguments& a, const std::string& value) { a.seconds = secondsFrom(value); }}},
      {"--microphone", {false, " record ", [](Arguments& a, const std::string&) { a.microphone = true; }}},
      {"--bundle", {true, " status ", [](Arguments& a, const std::string& value) { a.bundle = value; }}},
      {"--plot", {true, " metrics ", [](Arguments& a, const std::string& value) { a.plot = value; }}},
      {"--look", {false, " recover ", [](Arguments& a, const std::string&) { a.look = true; }}},
      {"--size", {true, " record ", [](Arguments& a, const std::string& value) { a.size = sizeFrom(value); }}}};
  return all;
}

}  // namespace

Arguments Arguments::parse(int argc, char** argv) {
  Arguments arguments;
  arguments.verb = argc > 1 ? argv[1] : "--help";
  for (int at = 2; at < argc; ++at) {
    std::string name = argv[at];
    if (!name.starts_with("-")) {
      arguments.rest.push_back(std::move(name));
      continue;
    }
    const auto option = options().find(name);
    if (option == options().end() || option->second.verbs.find(" " + arguments.verb + " ") == std::string::npos) {
      misused("'" + arguments.verb + "' has no option " + name);
    }
    if (option->second.hasValue && at + 1 == argc) misused(name + " needs a value");
    option->second.set(arguments, option->second.hasValue ? argv[++at] : "");
  }
  const size_t mayHave = arguments.verb == "save" ? 1 : 0;
  if (arguments.rest.size() > mayHave) misused("'" + arguments.rest[mayHave] + "' is one word too many");
  return arguments;
}

}  // namespace ctl
