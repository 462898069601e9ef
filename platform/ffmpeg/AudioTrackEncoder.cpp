#include "platform/ffmpeg/AudioTrackEncoder.h"

#include <algorithm>
#include <cmath>

#include "platform/mp4/MovieTrack.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {
namespace {

constexpr double kNanoseconds = 1e9;
/// Pictures come twice a second at least; when none comes for this long, sound goes on without.
constexpr int64_t kMaximumHeld = 1'500'000'000;
constexpr double kJitter = 0.020;
/// A time that lies this far after everything else is no gap but a mistake.
constexpr double kMaximumLead = 2.0;

}  // namespace

AudioTrackEncoder::AudioTrackEncoder(std::unique_ptr<AACEncoder> encoder)
    : encoder_(std::move(encoder)), converter_(encoder_->sampleRate()) {}

int64_t AudioTrackEncoder::Held::endTime() const {
  return captureTime + std::llround(static_cast<double>(sound.count()) / sound.sampleRate * kNanoseconds);
}

void AudioTrackEncoder::enqueue(const SampleBuffer& sample) {
  auto sound = readPCM(sample);
  if (!sound || sound->count() == 0 || !sample.captureTime().isNumeric()) {
    QV_LOG_DEBUG(logs::kMovie, "audio sample without usable sound dropped");
    return;
  }
  held_.push_back({sample.captureTime().valueAt(kHostTimescale), std::move(*sound)});
  heldDuration_ += held_.back().duration();
}

std::optional<Error> AudioTrackEncoder::advance(const RecordingTimeline& timeline,
                                                std::vector<mp4::EncodedSample>& out) {
  while (!held_.empty()) {
    const Held& first = held_.front();
    const bool isSettled = timeline.isAnchored() && first.endTime() <= timeline.horizon();
    if (!isSettled && heldDuration_ <= kMaximumHeld) break;
    if (auto error = place(first, timeline, out)) return error;
    heldDuration_ -= first.duration();
    held_.pop_front();
  }
  return std::nullopt;
}

std::optional<Error> AudioTrackEncoder::place(const Held& held, const RecordingTimeline& timeline,
                                              std::vector<mp4::EncodedSample>& out) {
  const double rate = held.sound.sampleRate;
  const auto frameAt = [&](int64_t time) {
    const double frame = std::ceil(static_cast<double>(time - held.captureTime) * rate / kNanoseconds - 1e-3);
    return static_cast<int64_t>(std::clamp(frame, 0.0, static_cast<double>(held.sound.count())));
  };
  const double outputRate = encoder_->sampleRate();
  const auto horizon = static_cast<double>(std::max(timeline.movieHorizon(), movieEnd_));
  const double limit = (horizon / kNanoseconds + kMaximumLead) * outputRate;
  for (size_t i = 0; i < timeline.segments().size(); ++i) {
    const auto& segment = timeline.segments()[i];
    if (segment.end <= held.captureTime || segment.start >= held.endTime()) continue;
    const int64_t from = frameAt(segment.start);
    const int64_t to = segment.end == RecordingTimeline::kOpen ? held.sound.count() : frameAt(segment.end);
    if (from >= to) continue;
    const double captured = static_cast<double>(held.captureTime - segment.start) / kNanoseconds;
    const double movieTime = static_cast<double>(segment.movieTime) / kNanoseconds + captured;
    const double position = (movieTime + static_cast<double>(from) / rate) * outputRate;
    const bool isNewSegment = i != segment_;
    segment_ = i;
    if (auto error = placePiece(held.sound, from, to, position, isNewSegment, limit, out)) return error;
  }
  return std::nullopt;
}

std::optional<Error> AudioTrackEncoder::placePiece(const StereoSound& sound, int64_t from, int64_t to, double position,
                                                   bool exactly, double limit, std::vector<mp4::EncodedSample>& out) {
  const double outputRate = encoder_->sampleRate();
  if (position > std::max(limit, static_cast<double>(encoder_->framesTaken()) + kMaximumLead * outputRate)) {
    QV_LOG_INFO(logs::kMovie, "audio sample far ahead of the picture dropped");
    return std::nullopt;
  }
  const bool continues =
      hasRun_ && !exactly && runRate_ == sound.sampleRate && std::abs(position - runEnd_) <= kJitter * outputRate;
  if (!continues) {
    int64_t skip = 0;
    if (auto error = endRun(out)) return error;
    if (auto error = moveTo(position, skip, sound.sampleRate, out)) return error;
    from += skip;
    if (from >= to) return std::nullopt;
    hasRun_ = true;
    runRate_ = sound.sampleRate;
    runEnd_ = static_cast<double>(encoder_->framesTaken());
  }
  converter_.convert(sound, from, to - from, converted_);
  runEnd_ += static_cast<double>(to - from) * outputRate / sound.sampleRate;
  return encodeConverted(out);
}

/// Fills up with silence to `position`, or says how many input frames at the front come too late.
std::optional<Error> AudioTrackEncoder::moveTo(double position, int64_t& skip, double inputRate,
                                               std::vector<mp4::EncodedSample>& out) {
  const int64_t gap = std::llround(position) - encoder_->framesTaken();
  if (gap >= 0) return encoder_->appendSilence(gap, out);
  skip = std::llround(static_cast<double>(-gap) * inputRate / encoder_->sampleRate());
  return std::nullopt;
}

std::optional<Error> AudioTrackEncoder::endRun(std::vector<mp4::EncodedSample>& out) {
  hasRun_ = false;
  converter_.endRun(converted_);
  return encodeConverted(out);
}

std::optional<Error> AudioTrackEncoder::encodeConverted(std::vector<mp4::EncodedSample>& out) {
  auto error = encoder_->append(converted_.left.data(), converted_.right.data(), converted_.count(), out);
  converted_.left.clear();
  converted_.right.clear();
  return error;
}

std::optional<Error> AudioTrackEncoder::placeRest(const RecordingTimeline& timeline, int64_t movieEnd,
                                                  std::vector<mp4::EncodedSample>& out) {
  movieEnd_ = movieEnd;
  for (const Held& held : held_) {
    if (auto error = place(held, timeline, out)) return error;
  }
  held_.clear();
  heldDuration_ = 0;
  return endRun(out);
}

int64_t AudioTrackEncoder::endTick() const {
  return static_cast<int64_t>(
      std::llround(static_cast<double>(encoder_->framesTaken()) * mp4::kMovieTimescale / encoder_->sampleRate()));
}

std::optional<Error> AudioTrackEncoder::finish(int64_t movieEnd, std::vector<mp4::EncodedSample>& out) {
  if (encoder_->framesTaken() == 0) return std::nullopt;
  const auto end = std::llround(static_cast<double>(movieEnd) / mp4::kMovieTimescale * encoder_->sampleRate());
  if (end > encoder_->framesTaken()) {
    if (auto error = encoder_->appendSilence(end - encoder_->framesTaken(), out)) return error;
  }
  return encoder_->flush(out);
}

}  // namespace qv::platform::ffmpeg
