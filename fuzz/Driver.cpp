// Runs a fuzz target without libFuzzer: on a fixed number of mutated seeds, the same in each run.
//   fuzz_x [--runs N] [--seed N]  runs N mutations
//   fuzz_x --seconds N [--seed N] runs as many as there is time for
//   fuzz_x --only SEED:RUN        runs that one again
//   fuzz_x --write-seeds FOLDER   writes the seeds, as a first corpus for libFuzzer
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <fstream>
#include <iterator>
#include <limits>
#include <random>

#include "fuzz/Target.h"

namespace {

using Random = std::mt19937_64;
using Clock = std::chrono::steady_clock;

volatile unsigned long currentSeed = 1;
volatile unsigned long currentRun = 0;

size_t below(Random& random, size_t bound) { return bound == 0 ? 0 : random() % bound; }

/// One change: what confuses parsers is a bit, a length, a missing end, a part that comes twice.
void mutate(std::string& input, const std::string& other, Random& random) {
  static constexpr uint32_t kLengths[] = {0, 1, 0x7F, 0xFF, 0xFFFF, 0x7FFFFFFF, 0x80000000, 0xFFFFFFFF};
  const size_t at = below(random, input.size());
  const size_t length = 1 + below(random, 8);
  switch (random() % 7) {
    case 0:
      if (!input.empty()) input[at] = static_cast<char>(input[at] ^ (1 << random() % 8));
      break;
    case 1:
      if (!input.empty()) input[at] = static_cast<char>(random());
      break;
    case 2: {
      uint32_t number = kLengths[random() % std::size(kLengths)];
      if (random() % 2) number = static_cast<uint32_t>(input.size() + random() % 9 - 4);
      const size_t aligned = at & ~size_t{3};
      if (aligned + 4 <= input.size()) input.replace(aligned, 4, reinterpret_cast<const char*>(&number), 4);
      break;
    }
    case 3:
      input.erase(at, length);
      break;
    case 4:
      input.insert(at, input.substr(below(random, input.size()), length));
      break;
    case 5:
      input.resize(at);
      break;
    case 6:
      input.replace(at, std::string::npos, other.substr(std::min(at, other.size())));
      break;
  }
}

void runOne(const std::string& input) {
  LLVMFuzzerTestOneInput(reinterpret_cast<const uint8_t*>(input.data()), input.size());
}

void runMutation(const std::vector<std::string>& seeds, unsigned long seed, unsigned long run) {
  currentSeed = seed;
  currentRun = run;
  Random random(seed * 0x9E3779B97F4A7C15u + run);
  std::string input = seeds[below(random, seeds.size())];
  for (size_t changes = 1 + random() % 3; changes > 0; --changes) {
    mutate(input, seeds[below(random, seeds.size())], random);
  }
  runOne(input);
}

void tellRun(int signal) {
  char text[128];
  const int size = std::snprintf(text, sizeof text, "failed: run it again with --only %lu:%lu\n",
                                 static_cast<unsigned long>(currentSeed), static_cast<unsigned long>(currentRun));
  (void)!::write(STDERR_FILENO, text, static_cast<size_t>(size));
  ::signal(signal, SIG_DFL);
  ::raise(signal);
}

int writeSeeds(const std::vector<std::string>& seeds, const std::string& folder) {
  for (size_t i = 0; i < seeds.size(); ++i) {
    std::ofstream file(folder + "/seed" + std::to_string(i), std::ios::binary);
    if (!(file << seeds[i] << std::flush)) return 1;
  }
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  for (const int signal : {SIGABRT, SIGSEGV, SIGBUS, SIGFPE}) ::signal(signal, tellRun);
  const auto seeds = qv::fuzz::seeds();
  unsigned long runs = 10000;
  auto end = Clock::time_point::max();
  unsigned long seed = 1;
  const std::vector<std::string> arguments(argv + 1, argv + argc);
  for (size_t i = 0; i < arguments.size(); ++i) {
    if (i + 1 == arguments.size()) return 2;
    if (arguments[i] == "--runs") {
      runs = std::stoul(arguments[++i]);
    } else if (arguments[i] == "--seconds") {
      runs = std::numeric_limits<unsigned long>::max();
      end = Clock::now() + std::chrono::seconds(std::stoul(arguments[++i]));
    } else if (arguments[i] == "--seed") {
      seed = std::stoul(arguments[++i]);
    } else if (arguments[i] == "--only") {
      const std::string& which = arguments[++i];
      runMutation(seeds, std::stoul(which), std::stoul(which.substr(which.find(':') + 1)));
      return 0;
    } else if (arguments[i] == "--write-seeds") {
      return writeSeeds(seeds, arguments[++i]);
    } else {
      return 2;
    }
  }
  for (const std::string& valid : seeds) runOne(valid);
  unsigned long run = 0;
  for (; run < runs && Clock::now() < end; ++run) runMutation(seeds, seed, run);
  std::printf("%lu runs\n", run);
}
