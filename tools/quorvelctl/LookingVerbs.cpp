// The verbs that only look: status, watch, list.

#include <algorithm>

#include "tools/quorvelctl/DaemonStatus.h"
#include "tools/quorvelctl/RecordingText.h"
#include "tools/quorvelctl/Verbs.h"
#include "tools/quorvelctl/Wording.h"

namespace ctl {

using nlohmann::json;

namespace {

constexpr int kBetweenLooks = 1000;  // milliseconds
constexpr size_t kUncut = 1000;      // characters: no terminal is so wide

void printConditions(Output& output, const std::string& bundle, const json& conditions) {
  const bool wouldStart = std::ranges::none_of(conditions, [](const json& each) { return each.contains("code"); });
  output.line((wouldStart ? "a recording could start: " : "no recording could start: ") + printable(bundle));
  for (const json& each : conditions) {
    if (each.value("met", false)) continue;
    output.line((each.contains("code") ? "  refused: " : "  note: ") + each.value("condition", "?") + ": " +
                printable(each.value("text", "")));
  }
}

std::string standingOf(const json& movie) {
  const std::string state = movie.value("state", "?");
  const std::string bundle = printable(movie.value("bundleIdentifier", ""));
  if (state == "waiting") return "may be saved by " + bundle;
  return bundle.empty() ? state : state + ", " + bundle;
}

}  // namespace

Exit showStatus(const Stage& stage) {
  DaemonStatus daemon;
  const std::string bundle = stage.arguments.bundle.value_or(kOwnBundle);
  const json recordings = daemon.recordings();
  const json conditions = daemon.startConditions(bundle, !stage.arguments.bundle, false);
  if (stage.arguments.json) {
    stage.output.json(
        {{"recordings", recordings}, {"bundle", bundle}, {"conditions", conditions}, {"device", daemon.device()}});
    return Exit::Success;
  }
  if (recordings.empty()) stage.output.line("nothing is recorded");
  for (const json& recording : recordings) stage.output.line(fitted(partsOf(recording), kUncut));
  printConditions(stage.output, bundle, conditions);
  return Exit::Success;
}

/// The daemon tells nothing by itself, so it is asked once a second, while somebody looks on.
Exit watch(const Stage& stage) {
  DaemonStatus daemon;
  std::string former;
  for (bool wasThere = false;; wasThere = true) {
    json recordings;
    try {
      recordings = daemon.recordings();
    } catch (Failure& failure) {
      stage.output.keep();
      if (wasThere && failure.code == Exit::NoDaemon) {
        failure = {Exit::DaemonLost, "the daemon went away: its log says why (journalctl -u quorveld)"};
      }
      throw failure;
    }
    const std::string line = lineOf(recordings, stage.output.isTerminal() ? Output::columns() - 1 : kUncut);
    if (stage.arguments.json) {
      stage.output.json({{"recordings", recordings}});
    } else if (stage.output.isTerminal()) {
      stage.output.redraw(line);
    } else if (line != former || !recordings.empty()) {
      stage.output.line(line);
    }
    former = line;
    if (stage.signals.await(kBetweenLooks)) break;
  }
  stage.output.keep();
  return Exit::Success;
}

Exit listMovies(const Stage& stage) {
  DaemonStatus daemon;
  const json movies = daemon.movies();
  if (stage.arguments.json) {
    stage.output.json({{"movies", movies}});
    return Exit::Success;
  }
  if (movies.empty()) stage.output.line("no movies that you may see");
  for (const json& movie : movies) {
    stage.output.line(dateText(movie.value("modified", 0.0)) + "  " + sizeText(movie.value("bytes", uint64_t{0})) +
                      "  " + printable(movie.value("name", "?")) + "  (" + standingOf(movie) + ")");
  }
  return Exit::Success;
}

}  // namespace ctl
