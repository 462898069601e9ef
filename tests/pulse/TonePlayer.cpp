// Plays tones, as told by lines on standard input; answers each with one line on standard output.
//   open SINK FREQUENCY...   silent streams, one for each tone        -> opened
//   tone                     lets all of them sound                   -> onset HOSTTIME (nanoseconds)
//   move SINK                moves all of them to another sink        -> moved
// usage: tone_player SERVER [--fork]     (with --fork a child process plays)
#include <pulse/pulseaudio.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <iostream>
#include <memory>
#include <numbers>
#include <sstream>
#include <string>
#include <vector>

namespace {

constexpr uint32_t kRate = 44100;
constexpr double kAmplitude = 8000;

struct Tone {
  pa_stream* stream = nullptr;
  double frequency = 0;
  uint64_t position = 0;
};

class Player {
 public:
  explicit Player(const char* server) : loop_(pa_threaded_mainloop_new()) {
    context_ = pa_context_new(pa_threaded_mainloop_get_api(loop_), "tone_player");
    pa_context_set_state_callback(
        context_, [](pa_context*, void* self) { signal(self); }, this);
    pa_threaded_mainloop_start(loop_);
    pa_threaded_mainloop_lock(loop_);
    if (pa_context_connect(context_, server, PA_CONTEXT_NOAUTOSPAWN, nullptr) < 0) std::exit(3);
    while (pa_context_get_state(context_) != PA_CONTEXT_READY) wait();
    pa_threaded_mainloop_unlock(loop_);
  }

  void handle(const std::string& line) {
    std::istringstream words(line);
    std::string command, sink;
    words >> command;
    pa_threaded_mainloop_lock(loop_);
    if (command == "open") {
      words >> sink;
      for (double frequency; words >> frequency;) open(sink, frequency);
      std::cout << "opened" << std::endl;
    } else if (command == "tone") {
      onset_ = 0;
      sounding_ = true;
      while (onset_ == 0) wait();
      std::cout << "onset " << onset_ << std::endl;
    } else if (command == "move") {
      words >> sink;
      for (const auto& tone : tones_) move(pa_stream_get_index(tone->stream), sink);
      std::cout << "moved" << std::endl;
    }
    pa_threaded_mainloop_unlock(loop_);
  }

 private:
  static void signal(void* self) { pa_threaded_mainloop_signal(static_cast<Player*>(self)->loop_, 0); }
  void wait() {
    if (!PA_CONTEXT_IS_GOOD(pa_context_get_state(context_))) ::_exit(4);
    pa_threaded_mainloop_wait(loop_);
  }

  void open(const std::string& sink, double frequency) {
    const pa_sample_spec spec{PA_SAMPLE_S16NE, kRate, 1};
    tones_.push_back(std::make_unique<Tone>(Tone{pa_stream_new(context_, "tone", &spec, nullptr), frequency, 0}));
    pa_stream* stream = tones_.back()->stream;
    pa_stream_set_state_callback(
        stream, [](pa_stream*, void* self) { signal(self); }, this);
    pa_stream_set_write_callback(
        stream, [](pa_stream* s, size_t bytes, void* self) { static_cast<Player*>(self)->fill(s, bytes); }, this);
    const pa_buffer_attr attributes{UINT32_MAX, kRate * 2 / 20, UINT32_MAX, UINT32_MAX, UINT32_MAX};
    const auto flags = static_cast<pa_stream_flags_t>(PA_STREAM_ADJUST_LATENCY | PA_STREAM_AUTO_TIMING_UPDATE |
                                                      PA_STREAM_INTERPOLATE_TIMING);
    pa_stream_connect_playback(stream, sink.c_str(), &attributes, flags, nullptr, nullptr);
    while (pa_stream_get_state(stream) != PA_STREAM_READY) wait();
  }

  void move(uint32_t index, const std::string& sink) {
    bool done = false;
    moved_ = &done;
    const auto moved = [](pa_context*, int success, void* self) {
      if (success == 0) ::_exit(5);
      *static_cast<Player*>(self)->moved_ = true;
      signal(self);
    };
    pa_operation_unref(pa_context_move_sink_input_by_name(context_, index, sink.c_str(), moved, this));
    while (!done) wait();
  }

  void fill(pa_stream* stream, size_t bytes) {
    for (const auto& tone : tones_) {
      if (tone->stream == stream) fill(*tone, bytes / 2);
    }
  }

  void fill(Tone& tone, size_t count) {
    std::vector<int16_t> samples(count);
    if (sounding_) {
      if (tone.position == 0) noteOnset(tone.stream);
      for (int16_t& sample : samples) {
        const double seconds = static_cast<double>(tone.position++) / kRate;
        sample = static_cast<int16_t>(kAmplitude * std::sin(2 * std::numbers::pi * tone.frequency * seconds));
      }
    }
    pa_stream_write(tone.stream, samples.data(), samples.size() * 2, nullptr, 0, PA_SEEK_RELATIVE);
  }

  /// The next sample written will be heard after the stream's latency.
  void noteOnset(pa_stream* stream) {
    pa_usec_t latency = 0;
    int isNegative = 0;
    pa_stream_get_latency(stream, &latency, &isNegative);
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    onset_ = now.tv_sec * 1'000'000'000LL + now.tv_nsec + static_cast<long long>(isNegative ? 0 : latency) * 1000;
    signal(this);
  }

  pa_threaded_mainloop* loop_;
  pa_context* context_ = nullptr;
  std::vector<std::unique_ptr<Tone>> tones_;
  bool sounding_ = false;
  long long onset_ = 0;
  bool* moved_ = nullptr;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  if (argc > 2 && std::string(argv[2]) == "--fork") {
    if (const pid_t child = ::fork(); child > 0) return ::waitpid(child, nullptr, 0) > 0 ? 0 : 1;
  }
  static Player player(argv[1]);
  for (std::string line; std::getline(std::cin, line);) player.handle(line);
  ::_exit(0);
}
