// quorvelctl: what the recording daemon does, and recordings of the screen, from the shell. The man page is
// packaging/man/quorvelctl.1.

#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <map>

#include "tools/quorvelctl/Verbs.h"

namespace {

using namespace ctl;

constexpr const char kHelp[] =
    "usage: quorvelctl VERB [OPTION...]\n"
    "  status [--bundle ID]    what records, and whether a recording could start\n"
    "  watch                   the same of what records, once a second\n"
    "  record [-o FILE] [--seconds N] [--microphone] [--size WxH]\n"
    "                          the screen, until Ctrl-C; without FILE into the photo library\n"
    "  stop [-o FILE]          ends what quorvelctl records\n"
    "  list                    the movies of the store\n"
    "  save [NAME] [-o FILE]   a movie of the store that waits for quorvelctl\n"
    "  extensions              the installed broadcast extensions\n"
    "  metrics [--plot FILE]   how the recordings of this device were; as a picture (SVG)\n"
    "  recover [--look]        finishes movies that a crash cut off\n"
    "  doctor                  what is wrong with this device, and what to do\n"
    "Every verb has --json. See quorvelctl(1).";

Exit run(int argc, char** argv, Output& output, const Signals& signals) {
  static const std::map<std::string, Exit (*)(const Stage&)> verbs{{"status", showStatus},
                                                                   {"watch", watch},
                                                                   {"record", record},
                                                                   {"stop", stop},
                                                                   {"list", listMovies},
                                                                   {"save", save},
                                                                   {"extensions", listExtensions},
                                                                   {"metrics", showMetrics},
                                                                   {"recover", recover},
                                                                   {"doctor", doctor}};
  const std::string word = argc > 1 ? argv[1] : "";
  if (word == "--help" || word == "-h" || word == "help") {
    output.line(kHelp);
    return Exit::Success;
  }
  if (word == "--version") {
    output.line("quorvelctl " CTL_VERSION);
    return Exit::Success;
  }
  const auto verb = verbs.find(word);
  if (verb == verbs.end()) {
    throw Failure{Exit::Usage, (word.empty() ? "no verb" : "no verb '" + word + "'") + "; see quorvelctl --help"};
  }
  const Arguments arguments = Arguments::parse(argc, argv);
  return verb->second({arguments, output, signals});
}

void complain(const std::string& text) {
  const std::string line = "quorvelctl: " + text + "\n";
  // There is nobody to tell where this fails; the exit code tells.
  (void)!::write(STDERR_FILENO, line.data(), line.size());
}

}  // namespace

int main(int argc, char** argv) {
  holdStandardDescriptors();
  // What the library logs is not for whoever types; the program that records inherits it.
  ::setenv("QUORVEL_LOG", "error", 0);
  std::signal(SIGPIPE, SIG_IGN);
  const Signals signals;
  Output output;
  try {
    return static_cast<int>(run(argc, argv, output, signals));
  } catch (const Failure& failure) {
    complain(failure.text);
    return static_cast<int>(failure.code);
  } catch (const nlohmann::json::exception&) {
    complain("what was read has not the form that is known here: update quorvelctl to the daemon's version");
    return static_cast<int>(Exit::Failed);
  }
}
