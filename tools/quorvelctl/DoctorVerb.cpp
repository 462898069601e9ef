#include <algorithm>

#include "tools/quorvelctl/SystemChecks.h"
#include "tools/quorvelctl/Verbs.h"

namespace ctl {

using nlohmann::json;

namespace {

const char* wordFor(Finding::State state) {
  if (state == Finding::State::Fine) return "fine";
  return state == Finding::State::Fault ? "FAULT" : "note";
}

std::vector<Finding> findAll() {
  auto findings = checkSystem();
  if (findings.front().state == Finding::State::Fault) return findings;
  try {
    const auto more = checkDaemon();
    findings.insert(findings.end(), more.begin(), more.end());
  } catch (const Failure& failure) {
    // What went wrong, and what to do, as everywhere in one line.
    const size_t end = std::min(failure.text.rfind(": "), failure.text.size());
    const std::string advice = end + 2 < failure.text.size() ? failure.text.substr(end + 2) : "look into its log";
    findings.push_back({"answers", Finding::State::Fault, failure.text.substr(0, end), advice});
  }
  return findings;
}

}  // namespace

Exit doctor(const Stage& stage) {
  json list = json::array();
  const auto findings = findAll();
  for (const Finding& each : findings) {
    if (stage.arguments.json) {
      list.push_back(
          {{"check", each.check}, {"state", wordFor(each.state)}, {"text", each.text}, {"advice", each.advice}});
      continue;
    }
    stage.output.line(std::string(wordFor(each.state)) + "  " + each.check + ": " + each.text);
    if (!each.advice.empty()) stage.output.line("       do: " + each.advice);
  }
  if (stage.arguments.json) stage.output.json({{"findings", std::move(list)}});
  const bool isFine =
      std::ranges::none_of(findings, [](const auto& each) { return each.state == Finding::State::Fault; });
  return isFine ? Exit::Success : Exit::Failed;
}

}  // namespace ctl
