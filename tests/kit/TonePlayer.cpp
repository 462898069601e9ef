// Plays tones, as told by lines on descriptor 3, each answered with a line, until these end:
//   open SINK FREQUENCY...   silent streams, one for each tone        -> opened
//   sound                    lets all of them sound                   -> the host time of the first sample
//   (nanoseconds)
// usage: tone_player SERVER --stay|--fork     (with --fork a child process plays)
#include <pulse/simple.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cmath>
#include <fstream>
#include <future>
#include <iostream>
#include <numbers>
#include <sstream>
#include <string>
#include <thread>

namespace {

constexpr uint32_t kRate = 44100;
constexpr double kAmplitude = 8000;
/// Of 10 ms: after these the stream plays, and its latency is known.
constexpr int kSilentParts = 20;

std::atomic<bool> isSounding = false;
std::atomic<int64_t> onset = 0;

/// The next sample written will be heard after the stream's latency.
int64_t timeOfNextSample(pa_simple* stream) {
  const auto latency = std::chrono::microseconds(pa_simple_get_latency(stream, nullptr));
  return std::chrono::nanoseconds(std::chrono::steady_clock::now().time_since_epoch() + latency).count();
}

void play(pa_simple* stream, double frequency, std::promise<void> runs) {
  std::array<int16_t, kRate / 100> samples{};
  uint64_t position = 0;
  int parts = 0;
  do {
    if (++parts == kSilentParts) runs.set_value();
    if (!isSounding) continue;
    if (int64_t none = 0; position == 0) onset.compare_exchange_strong(none, timeOfNextSample(stream));
    onset.notify_all();
    for (int16_t& sample : samples) {
      const double seconds = static_cast<double>(position++) / kRate;
      sample = static_cast<int16_t>(kAmplitude * std::sin(2 * std::numbers::pi * frequency * seconds));
    }
  } while (pa_simple_write(stream, samples.data(), sizeof samples, nullptr) == 0);
}

void open(const char* server, const std::string& sink, double frequency) {
  const pa_sample_spec spec{PA_SAMPLE_S16NE, kRate, 1};
  const pa_buffer_attr attributes{UINT32_MAX, kRate * 2 / 20, UINT32_MAX, UINT32_MAX, UINT32_MAX};
  pa_simple* stream = pa_simple_new(server, "tone_player", PA_STREAM_PLAYBACK, sink.c_str(), "tone", &spec, nullptr,
                                    &attributes, nullptr);
  if (stream == nullptr) ::_exit(3);
  std::promise<void> runs;
  auto running = runs.get_future();
  std::thread(play, stream, frequency, std::move(runs)).detach();
  running.wait();
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 3) return 2;
  if (std::string(argv[2]) == "--fork") {
    if (const pid_t child = ::fork(); child > 0) return ::waitpid(child, nullptr, 0) > 0 ? 0 : 1;
  }
  std::ifstream commands("/dev/fd/3");
  for (std::string line; std::getline(commands, line);) {
    std::istringstream words(line);
    std::string command, sink;
    words >> command >> sink;
    if (command == "open") {
      for (double frequency; words >> frequency;) open(argv[1], sink, frequency);
      std::cout << "opened" << std::endl;
    } else {
      isSounding = true;
      onset.wait(0);
      std::cout << onset << std::endl;
    }
  }
  ::_exit(0);
}
