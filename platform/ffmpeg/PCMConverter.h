#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "platform/base/SampleBuffer.h"
#include "platform/ffmpeg/FFmpegHandles.h"

namespace qv::platform::ffmpeg {

/// Sound as two equally long runs of samples between -1 and 1.
struct StereoSound {
  double sampleRate = 0;
  std::vector<float> left;
  std::vector<float> right;
  [[nodiscard]] int64_t count() const { return static_cast<int64_t>(left.size()); }
};

/// Reads interleaved linear PCM: 16 or 32 bit integers or 32 bit float, either byte order. One
/// channel goes to both sides at its full level; of more than two the first two are taken. Nothing
/// where the format is another one.
std::optional<StereoSound> readPCM(const SampleBuffer& sample);

/// Converts one unbroken run of sound after another to a fixed sample rate.
///
/// Threading: confined to one thread.
class RateConverter {
 public:
  explicit RateConverter(int outputRate) : outputRate_(outputRate) {}

  /// Appends what is ready of `frames` [from, from + count) to `out`.
  void convert(const StereoSound& sound, int64_t from, int64_t count, StereoSound& out);
  /// The run is over: appends what is left of it.
  void endRun(StereoSound& out);

 private:
  void open(double rate);
  void drain(const uint8_t** in, int count, StereoSound& out);

  const int outputRate_;
  double inputRate_ = 0;
  Resampler resampler_;
};

}  // namespace qv::platform::ffmpeg
