#include "platform/pulse/PulseMicrophone.h"

#include "platform/pulse/PulseTapSource.h"
#include "platform/threads/Log.h"

namespace qv::platform {

PulseMicrophone::PulseMicrophone(const std::string& server, const PCMFormat& format)
    : format_(format),
      timeline_(std::make_shared<MixTimeline>(format.sampleRate)),
      connection_(server, {.ready = [this](pa_context* context) { ready(context); }, .lost = [this] { lost(); }}) {}

std::chrono::nanoseconds PulseMicrophone::latency() const { return kPulseLatency; }

void PulseMicrophone::awaitSound(uint64_t hostTime) { timeline_->await(hostTime, kPulseLatency, kPulsePatience); }

void PulseMicrophone::render(uint64_t hostTime, std::span<int16_t> samples) {
  timeline_->read(hostTime, format_.channels, samples);
}

void PulseMicrophone::ready(pa_context* context) {
  if (track_) return;
  const auto found = [](pa_context* c, const pa_source_info* source, int end, void* self) {
    if (end <= 0) static_cast<PulseMicrophone*>(self)->open(c, end == 0 ? source : nullptr);
  };
  dropOperation(pa_context_get_source_info_by_name(context, kPulseDefaultSource, found, this));
}

void PulseMicrophone::lost() { track_.reset(); }

void PulseMicrophone::open(pa_context* context, const pa_source_info* source) {
  if (track_) return;
  if (source != nullptr && isMicrophone(*source)) {
    track_ = std::make_unique<PulseTrack>(context, PulseTrack::Target{{}, source->name}, timeline_,
                                          [this] { trackEnded(); });
    if (track_->isConnecting()) return;
    track_.reset();
  }
  QV_LOG_INFO(logs::kAudio, "no microphone: silence for now");
  connection_.retryLater();
}

void PulseMicrophone::trackEnded() {
  track_.reset();
  connection_.retryLater();
}

}  // namespace qv::platform
