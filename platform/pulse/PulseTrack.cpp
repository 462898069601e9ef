#include "platform/pulse/PulseTrack.h"

#include <algorithm>
#include <cstdlib>

#include "platform/threads/Clock.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr uint32_t kFrameSize = 4;  // stereo, 16 bits: mono would be mixed differently by each server
constexpr uint32_t kFragmentsPerSecond = 50;

pa_sample_spec specOf(const MixTimeline& timeline) { return {PA_SAMPLE_S16NE, timeline.sampleRate(), 2}; }

pa_stream* makeStream(pa_context* context, const MixTimeline& timeline) {
  const pa_sample_spec spec = specOf(timeline);
  return pa_stream_new(context, "recording", &spec, nullptr);
}

}  // namespace

PulseTrack::PulseTrack(pa_context* context, const Target& target, std::shared_ptr<MixTimeline> timeline,
                       std::function<void()> ended)
    : timeline_(std::move(timeline)), ended_(std::move(ended)), stream_(makeStream(context, *timeline_)) {
  if (stream_ != nullptr) connect(target);
}

PulseTrack::~PulseTrack() {
  timeline_->forget(this);
  if (stream_ == nullptr) return;
  pa_stream_set_state_callback(stream_, nullptr, nullptr);
  pa_stream_set_read_callback(stream_, nullptr, nullptr);
  pa_stream_set_suspended_callback(stream_, nullptr, nullptr);
  pa_stream_disconnect(stream_);
  pa_stream_unref(stream_);
}

void PulseTrack::connect(const Target& target) {
  pa_stream_set_state_callback(
      stream_, [](pa_stream*, void* self) { static_cast<PulseTrack*>(self)->stateChanged(); }, this);
  pa_stream_set_read_callback(
      stream_, [](pa_stream*, size_t, void* self) { static_cast<PulseTrack*>(self)->readAvailable(); }, this);
  // Time stood still while the device was suspended.
  pa_stream_set_suspended_callback(
      stream_, [](pa_stream*, void* self) { static_cast<PulseTrack*>(self)->anchored_ = false; }, this);
  int flags = PA_STREAM_ADJUST_LATENCY | PA_STREAM_AUTO_TIMING_UPDATE | PA_STREAM_INTERPOLATE_TIMING;
  if (target.sinkInput) {
    // Without DONT_MOVE a server may record the microphone in place of an input that has just gone.
    flags |= PA_STREAM_DONT_MOVE;
    if (pa_stream_set_monitor_stream(stream_, *target.sinkInput) < 0) return;
  }
  const uint32_t fragment = timeline_->sampleRate() / kFragmentsPerSecond * kFrameSize;
  const pa_buffer_attr attributes{UINT32_MAX, UINT32_MAX, UINT32_MAX, UINT32_MAX, fragment};
  const char* device = target.device.empty() ? nullptr : target.device.c_str();
  connecting_ = pa_stream_connect_record(stream_, device, &attributes, static_cast<pa_stream_flags_t>(flags)) == 0;
}

void PulseTrack::stateChanged() {
  const pa_stream_state_t state = pa_stream_get_state(stream_);
  if (PA_STREAM_IS_GOOD(state)) return;
  QV_LOG_DEBUG(logs::kAudio, "recorded stream ended");
  const auto ended = ended_;  // this object may not outlive the call
  ended();
}

/// The frame of the first unread sample, of which `pending` bytes are readable.
void PulseTrack::anchor(int64_t pending) {
  const uint32_t rate = timeline_->sampleRate();
  pa_usec_t latency = 0;
  int isNegative = 0;
  int64_t age = pending / kFrameSize * 1'000'000'000 / rate;
  const bool isReported = pa_stream_get_latency(stream_, &latency, &isNegative) == 0;
  if (isReported) age = (isNegative != 0 ? -1 : 1) * static_cast<int64_t>(latency) * 1000;
  const int64_t measured = timeline_->frameAt(hostNanoseconds() - age);
  const bool settlesNow = anchored_ && !settled_ && isReported && counted_ >= rate / 10;
  const bool isOff = settled_ && isReported && std::abs(measured - position_) > rate / 25;
  if (anchored_ && !settlesNow && !isOff) return;
  if (isOff)
    QV_LOG_DEBUG(logs::kAudio, "recorded stream is off by %lld frames", static_cast<long long>(measured - position_));
  settled_ = anchored_ && isReported;
  counted_ = anchored_ ? counted_ : 0;
  anchored_ = true;
  position_ = measured;
}

void PulseTrack::readAvailable() {
  const size_t pending = pa_stream_readable_size(stream_);
  if (pending == static_cast<size_t>(-1) || pending == 0) return;
  anchor(static_cast<int64_t>(pending));
  for (;;) {
    const void* data = nullptr;
    size_t bytes = 0;
    if (pa_stream_peek(stream_, &data, &bytes) < 0 || bytes == 0) break;
    place(data, bytes);
    pa_stream_drop(stream_);
  }
  timeline_->reached(this, placed_);
}

/// `data` is null for a hole.
void PulseTrack::place(const void* data, size_t bytes) {
  const auto frames = static_cast<int64_t>(bytes / kFrameSize);
  const int64_t overlap = std::clamp<int64_t>(placed_ - position_, 0, frames);
  if (data != nullptr && overlap < frames) {
    const std::span<const int16_t> stereo(static_cast<const int16_t*>(data), static_cast<size_t>(frames) * 2);
    timeline_->add(position_ + overlap, stereo.subspan(static_cast<size_t>(overlap) * 2));
  }
  position_ += frames;
  counted_ += frames;
  placed_ = std::max(placed_, position_);
}

}  // namespace qv::platform
