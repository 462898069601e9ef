#include "platform/pulse/PulseSounds.h"

#include <cmath>
#include <numbers>
#include <vector>

#include "platform/pulse/PulseSession.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr uint32_t kRecordingBegins = 1117;
constexpr uint32_t kRecordingEnds = 1118;
constexpr uint32_t kRate = 44100;
constexpr double kLow = 880;    // Hz
constexpr double kHigh = 1320;  // Hz
constexpr double kNoteLength = 0.12;
constexpr double kAmplitude = 9000;

/// A note that begins in 5 ms and dies away.
void appendNote(std::vector<int16_t>& samples, double frequency) {
  const auto count = static_cast<size_t>(kNoteLength * kRate);
  for (size_t i = 0; i < count; ++i) {
    const double seconds = static_cast<double>(i) / kRate;
    const double envelope = std::min(1.0, seconds / 0.005) * (1 - seconds / kNoteLength);
    const double wave = std::sin(2 * std::numbers::pi * frequency * seconds);
    samples.push_back(static_cast<int16_t>(kAmplitude * envelope * wave));
  }
}

struct StreamDeleter {
  void operator()(pa_stream* stream) const {
    pa_stream_disconnect(stream);
    pa_stream_unref(stream);
  }
};

bool playSamples(const std::string& server, const std::vector<int16_t>& samples) {
  PulseSession session(server, std::chrono::seconds(3));
  if (!session.isConnected()) return false;
  const pa_sample_spec spec{PA_SAMPLE_S16NE, kRate, 1};
  const PulsePointer<pa_proplist> properties(pa_proplist_new());
  pa_proplist_sets(properties.get(), PA_PROP_MEDIA_ROLE, "event");
  const std::unique_ptr<pa_stream, StreamDeleter> stream(
      pa_stream_new_with_proplist(session.context(), "sound", &spec, nullptr, properties.get()));
  if (!stream) return false;
  if (pa_stream_connect_playback(stream.get(), nullptr, nullptr, PA_STREAM_NOFLAGS, nullptr, nullptr) < 0) return false;
  const auto isReady = [&] { return pa_stream_get_state(stream.get()) != PA_STREAM_CREATING; };
  if (!session.runUntil(isReady) || pa_stream_get_state(stream.get()) != PA_STREAM_READY) return false;
  if (pa_stream_write(stream.get(), samples.data(), samples.size() * 2, nullptr, 0, PA_SEEK_RELATIVE) < 0) return false;
  bool isDrained = false;
  const auto drained = [](pa_stream*, int, void* done) { *static_cast<bool*>(done) = true; };
  dropOperation(pa_stream_drain(stream.get(), drained, &isDrained));
  return session.runUntil([&] { return isDrained; });
}

}  // namespace

void PulseSounds::play(uint32_t soundID) {
  if (soundID != kRecordingBegins && soundID != kRecordingEnds) {
    QV_LOG(logs::kAudio, "unknown sound %u", soundID);
    return;
  }
  globalQueue().post([server = server_, soundID] {
    std::vector<int16_t> samples;
    appendNote(samples, soundID == kRecordingBegins ? kLow : kHigh);
    appendNote(samples, soundID == kRecordingBegins ? kHigh : kLow);
    if (!playSamples(server, samples)) QV_LOG_INFO(logs::kAudio, "sound %u could not be played", soundID);
  });
}

}  // namespace qv::platform
