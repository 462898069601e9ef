// The program of the bundle that may record the screen. quorvelctl starts it, and shows what it says.
//
//   quorvelctl-recorder record WIDTH HEIGHT 0|1 [FILE]     until SIGINT, or until standard input is closed
//   quorvelctl-recorder finish [FILE]
//   quorvelctl-recorder save MOVIE-URL [FILE]

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "tools/quorvelctl/RecorderLock.h"
#include "tools/quorvelctl/recorder/SystemRecorder.h"

namespace {

using namespace ctl;

std::unique_ptr<OutputFile> fileAt(const std::vector<std::string>& words, size_t at) {
  return words.size() > at ? std::make_unique<OutputFile>(words[at]) : nullptr;
}

RecorderLock lock() {
  auto lock = RecorderLock::take();
  if (lock) return std::move(*lock);
  throw Failure{Exit::Failed, "another quorvelctl records or saves: end it by quorvelctl stop"};
}

void work(Loop& loop, const std::vector<std::string>& words) {
  const RecorderLock alone = lock();
  const std::string& verb = words.at(0);
  const size_t place = verb == "record" ? 4 : verb == "save" ? 2 : 1;
  SystemRecorder recorder(loop, fileAt(words, place));
  if (verb == "record")
    recorder.record(std::atoi(words.at(1).c_str()), std::atoi(words.at(2).c_str()), words.at(3) == "1");
  if (verb == "finish") recorder.finish();
  if (verb == "save") recorder.save(words.at(1));
  loop.run();
}

}  // namespace

int main(int argc, char** argv) {
  const std::vector<std::string> words(argv + 1, argv + argc);
  const std::string verb = words.empty() ? "" : words.front();
  const size_t least = verb == "record" ? 4 : verb == "save" ? 2 : 1;
  if ((verb != "record" && verb != "finish" && verb != "save") || words.size() < least) {
    std::fprintf(stderr, "quorvelctl-recorder is started by quorvelctl\n");
    return static_cast<int>(Exit::Usage);
  }
  std::signal(SIGPIPE, SIG_IGN);
  const Signals signals;
  Loop loop(signals);
  try {
    work(loop, words);
  } catch (const Failure& failure) {
    std::printf("%s\n",
                nlohmann::json{{"event", "failed"}, {"code", static_cast<int>(failure.code)}, {"text", failure.text}}
                    .dump(-1, ' ', false, nlohmann::json::error_handler_t::replace)
                    .c_str());
  }
  return 0;
}
