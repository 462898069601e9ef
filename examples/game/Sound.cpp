#include "Sound.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <numbers>
#include <utility>
#include <vector>

#include "Scene.h"

namespace comet {

namespace {

using namespace std::chrono_literals;

constexpr int kRate = 48'000, kChannels = 2;
constexpr size_t kFrameBytes = kChannels * sizeof(int16_t);
constexpr double kFrequency = 1000, kAmplitude = 12'000;
/// Asked of the server: what it holds of ours ahead of the hearing.
constexpr auto kBuffer = 50ms;
/// The server's estimates waver by a few milliseconds; less than this is not followed.
constexpr auto kTolerance = 8ms;

Instant durationOf(int64_t frames) { return Instant(frames * 1'000'000'000 / kRate); }

/// Holds libpulse's lock, which its callbacks run under too.
struct Lock {
  explicit Lock(pa_threaded_mainloop* held) : loop(held) { pa_threaded_mainloop_lock(loop); }
  ~Lock() { pa_threaded_mainloop_unlock(loop); }
  pa_threaded_mainloop* loop;
};

}  // namespace

std::unique_ptr<Sound> Sound::create(const char* name, std::optional<double> tone, std::string& error) {
  std::unique_ptr<Sound> sound(new Sound(tone));
  if (sound->open(name)) return sound;
  error = sound->context_ ? pa_strerror(pa_context_errno(sound->context_)) : "out of memory";
  return nullptr;
}

Sound::Sound(std::optional<double> tone) : tone_(tone), loop_(pa_threaded_mainloop_new()) {}

Sound::~Sound() {
  pa_threaded_mainloop_stop(loop_);
  if (stream_) {
    pa_stream_disconnect(stream_);
    pa_stream_unref(stream_);
  }
  if (context_) {
    pa_context_disconnect(context_);
    pa_context_unref(context_);
  }
  pa_threaded_mainloop_free(loop_);
}

bool Sound::open(const char* name) {
  if (pa_threaded_mainloop_start(loop_) < 0) return false;
  const Lock lock(loop_);
  const auto wake = [](auto*, void* self) { pa_threaded_mainloop_signal(static_cast<Sound*>(self)->loop_, 0); };
  context_ = pa_context_new(pa_threaded_mainloop_get_api(loop_), name);
  if (!context_) return false;
  pa_context_set_state_callback(context_, wake, this);
  if (pa_context_connect(context_, nullptr, PA_CONTEXT_NOAUTOSPAWN, nullptr) < 0) return false;
  while (pa_context_get_state(context_) != PA_CONTEXT_READY) {
    if (!PA_CONTEXT_IS_GOOD(pa_context_get_state(context_))) return false;
    pa_threaded_mainloop_wait(loop_);
  }

  const pa_sample_spec format{PA_SAMPLE_S16LE, kRate, kChannels};
  stream_ = pa_stream_new(context_, name, &format, nullptr);
  if (!stream_) return false;
  pa_stream_set_state_callback(stream_, wake, this);
  pa_stream_set_write_callback(
      stream_, [](pa_stream*, size_t bytes, void* self) { static_cast<Sound*>(self)->write(bytes); }, this);
  pa_buffer_attr buffer;
  buffer.maxlength = buffer.prebuf = buffer.minreq = buffer.fragsize = UINT32_MAX;
  buffer.tlength = kRate * kFrameBytes * kBuffer.count() / 1000;
  const auto flags = static_cast<pa_stream_flags_t>(PA_STREAM_INTERPOLATE_TIMING | PA_STREAM_AUTO_TIMING_UPDATE |
                                                    PA_STREAM_ADJUST_LATENCY);
  if (pa_stream_connect_playback(stream_, nullptr, &buffer, flags, nullptr, nullptr) < 0) return false;
  while (pa_stream_get_state(stream_) != PA_STREAM_READY) {
    if (!PA_STREAM_IS_GOOD(pa_stream_get_state(stream_))) return false;
    pa_threaded_mainloop_wait(loop_);
  }
  return true;
}

void Sound::anchorTo(Instant heard) {
  const Instant anchor = heard - durationOf(written_);
  if (!anchor_ || anchor - *anchor_ > kTolerance || *anchor_ - anchor > kTolerance) {
    anchor_ = anchor;
  } else {
    *anchor_ += (anchor - *anchor_) / 16;
  }
}

int16_t Sound::sampleAt(Instant heard) const {
  if (!tone_ && !isFlash(heard)) return 0;
  // Frequencies are whole, so that a tone goes on smoothly into the next second.
  const double seconds = std::chrono::duration<double>(heard % 1s).count();
  const double turns = std::round(tone_.value_or(kFrequency)) * seconds;
  return static_cast<int16_t>(std::lround(kAmplitude * std::sin(2 * std::numbers::pi * turns)));
}

void Sound::write(size_t bytes) {
  pa_usec_t latency = 0;
  int negative = 0;
  // Unknown until the server has told of the stream for the first time; silence until then.
  if (pa_stream_get_latency(stream_, &latency, &negative) == 0)
    anchorTo(now() + std::chrono::microseconds(negative ? -static_cast<int64_t>(latency) : latency));
  std::vector<int16_t> samples(bytes / kFrameBytes * kChannels, 0);
  for (size_t frame = 0; anchor_ && frame < samples.size() / kChannels; ++frame) {
    const int16_t sample = sampleAt(*anchor_ + durationOf(written_ + static_cast<int64_t>(frame)));
    std::fill_n(samples.begin() + frame * kChannels, kChannels, sample);
  }
  pa_stream_write(stream_, samples.data(), samples.size() * sizeof(int16_t), nullptr, 0, PA_SEEK_RELATIVE);
  written_ += static_cast<int64_t>(samples.size() / kChannels);
}

}  // namespace comet
