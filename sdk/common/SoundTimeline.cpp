#include "sdk/common/SoundTimeline.h"

#include <cmath>

namespace qv::sdk {
namespace {

using namespace std::chrono_literals;
using Time = SoundTimeline::Time;

/// Far beyond any clock, and far from an overflow.
constexpr Time kLatest = std::chrono::hours(24 * 365 * 100);
/// A picture that stands still is shown for half a second. Sound that lies further back than this is no overlap: the
/// former lay wrongly, and holding on to its end would leave the stream silent.
constexpr Time kLongestOverlap = 2s;

Time lengthOf(int64_t frames, double sampleRate) {
  return Time(std::llround(static_cast<double>(frames) / sampleRate * 1e9));
}

void cutOff(quorvel::AudioSample& sample, int64_t frames) {
  const auto bytes = static_cast<std::ptrdiff_t>(frames) * static_cast<std::ptrdiff_t>(sample.format.bytesPerFrame);
  const Time length = lengthOf(frames, sample.format.sampleRate);
  sample.bytes.erase(sample.bytes.begin(), sample.bytes.begin() + bytes);
  sample.frameCount -= frames;
  sample.presentationTime += length;
  if (sample.duration && *sample.duration > length) *sample.duration -= length;
}

}  // namespace

bool SoundTimeline::place(quorvel::AudioSample& sample, Time pauses) {
  if (pauses < Time(0) || sample.presentationTime < pauses || sample.presentationTime > kLatest) return false;
  sample.presentationTime -= pauses;
  const double rate = sample.format.sampleRate;
  if (!(rate >= 1)) return true;
  auto& end = ends_[sample.source == quorvel::AudioSample::Source::Microphone ? 1 : 0];
  const Time overlap = end ? *end - sample.presentationTime : Time(0);
  if (overlap <= kLongestOverlap) {
    const auto frames = std::llround(static_cast<double>(overlap.count()) / 1e9 * rate);
    if (frames > 0 && frames >= sample.frameCount) return false;
    if (frames > 0) cutOff(sample, frames);
  }
  end = sample.presentationTime + lengthOf(sample.frameCount, rate);
  return true;
}

}  // namespace qv::sdk
