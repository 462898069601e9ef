#include "platform/pulse/MixTimeline.h"

#include <algorithm>
#include <cstdlib>
#include <utility>

#include "platform/threads/Clock.h"

namespace qv::platform {
namespace {

constexpr int64_t kNanosecondsPerSecond = 1'000'000'000;

int16_t clip(int32_t value) { return static_cast<int16_t>(std::clamp(value, -32768, 32767)); }

}  // namespace

MixTimeline::MixTimeline(uint32_t sampleRate)
    : sampleRate_(sampleRate),
      capacity_(size_t{2} * sampleRate),
      sums_(2 * capacity_),
      next_(frameAt(hostNanoseconds())) {}

int64_t MixTimeline::frameAt(int64_t hostTime) const {
  const int64_t rest = hostTime % kNanosecondsPerSecond * sampleRate_;
  return hostTime / kNanosecondsPerSecond * sampleRate_ + (rest + kNanosecondsPerSecond / 2) / kNanosecondsPerSecond;
}

void MixTimeline::add(int64_t position, std::span<const int16_t> stereo) {
  std::lock_guard lock(mutex_);
  const int64_t first = std::max(position, next_);
  const int64_t end =
      std::min(position + static_cast<int64_t>(stereo.size() / 2), next_ + static_cast<int64_t>(capacity_));
  for (int64_t frame = first; frame < end; ++frame) {
    const size_t slot = 2 * (static_cast<size_t>(frame) % capacity_);
    const auto source = static_cast<size_t>(frame - position) * 2;
    sums_[slot] += stereo[source];
    sums_[slot + 1] += stereo[source + 1];
  }
}

void MixTimeline::reached(const void* key, int64_t end) {
  std::lock_guard lock(mutex_);
  ends_[key] = end;
  moved_.notify_all();
}

void MixTimeline::forget(const void* key) {
  std::lock_guard lock(mutex_);
  ends_.erase(key);
  moved_.notify_all();
}

void MixTimeline::await(uint64_t hostTime, std::chrono::nanoseconds stalled, std::chrono::nanoseconds limit) {
  const int64_t wanted = frameAt(static_cast<int64_t>(hostTime));
  const int64_t oldest = frameAt(static_cast<int64_t>(hostTime) - stalled.count());
  const auto isComing = [&](const auto& stream) { return stream.second >= oldest && stream.second < wanted; };
  std::unique_lock lock(mutex_);
  moved_.wait_for(lock, limit, [&] { return std::none_of(ends_.begin(), ends_.end(), isComing); });
}

void MixTimeline::read(uint64_t hostTime, uint32_t channels, std::span<int16_t> samples) {
  std::lock_guard lock(mutex_);
  const auto frames = static_cast<int64_t>(samples.size() / channels);
  int64_t first = frameAt(static_cast<int64_t>(hostTime));
  // Times are rounded, so a read that continues the last one may seem to be a frame off.
  if (std::abs(first - next_) <= 1) first = next_;
  for (int64_t skipped = next_; skipped < first && skipped < next_ + static_cast<int64_t>(capacity_); ++skipped) {
    const size_t slot = 2 * (static_cast<size_t>(skipped) % capacity_);
    sums_[slot] = sums_[slot + 1] = 0;
  }
  for (int64_t frame = first; frame < first + frames; ++frame) {
    const size_t slot = 2 * (static_cast<size_t>(frame) % capacity_);
    const auto target = static_cast<size_t>(frame - first) * channels;
    const bool isHeld = frame >= next_;
    const int32_t left = isHeld ? std::exchange(sums_[slot], 0) : 0;
    const int32_t right = isHeld ? std::exchange(sums_[slot + 1], 0) : 0;
    samples[target] = channels == 1 ? clip((left + right) / 2) : clip(left);
    if (channels == 2) samples[target + 1] = clip(right);
  }
  next_ = std::max(next_, first + frames);
}

}  // namespace qv::platform
