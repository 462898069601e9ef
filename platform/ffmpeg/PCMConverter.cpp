#include "platform/ffmpeg/PCMConverter.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>

namespace qv::platform::ffmpeg {
namespace {

constexpr double kMinimumRate = 4000;
constexpr double kMaximumRate = 400000;

using Reader = float (*)(const uint8_t*);

template <bool kSwap>
uint32_t load32(const uint8_t* at) {
  uint32_t bits = 0;
  std::memcpy(&bits, at, 4);
  return kSwap ? __builtin_bswap32(bits) : bits;
}
template <bool kSwap>
float readInt16(const uint8_t* at) {
  uint16_t bits = 0;
  std::memcpy(&bits, at, 2);
  return static_cast<float>(static_cast<int16_t>(kSwap ? __builtin_bswap16(bits) : bits)) / 32768.0f;
}
template <bool kSwap>
float readInt32(const uint8_t* at) {
  return static_cast<float>(static_cast<int32_t>(load32<kSwap>(at))) / 2147483648.0f;
}
template <bool kSwap>
float readFloat(const uint8_t* at) {
  const float value = std::bit_cast<float>(load32<kSwap>(at));
  return std::isfinite(value) ? std::clamp(value, -1.0f, 1.0f) : 0.0f;
}

Reader readerFor(const AudioStreamDescription& format) {
  static_assert(std::endian::native == std::endian::little);
  const bool swap = (format.formatFlags & kAudioFormatFlagIsBigEndian) != 0;
  if ((format.formatFlags & kAudioFormatFlagIsFloat) != 0) {
    return format.bitsPerChannel == 32 ? (swap ? readFloat<true> : readFloat<false>) : nullptr;
  }
  if (format.bitsPerChannel == 16) return swap ? readInt16<true> : readInt16<false>;
  if (format.bitsPerChannel == 32) return swap ? readInt32<true> : readInt32<false>;
  return nullptr;
}

}  // namespace

std::optional<StereoSound> readPCM(const SampleBuffer& sample) {
  if (!sample.data() || !sample.audioFormat()) return std::nullopt;
  const AudioStreamDescription& format = sample.audioFormat()->streamDescription;
  const Reader read = readerFor(format);
  const size_t sampleBytes = format.bitsPerChannel / 8;
  const size_t channels = format.channelsPerFrame;
  // Not a comparison that NaN passes.
  const bool isRateGood = format.sampleRate >= kMinimumRate && format.sampleRate <= kMaximumRate;
  if (format.formatID != kAudioFormatLinearPCM || read == nullptr || channels == 0 || channels > 64 || !isRateGood) {
    return std::nullopt;
  }
  const size_t frameBytes = std::max<size_t>(format.bytesPerFrame, sampleBytes * channels);
  const auto bytes = sample.data()->bytes();
  const size_t count =
      std::min(bytes.size() / frameBytes, static_cast<size_t>(std::max<int64_t>(0, sample.numSamples())));
  StereoSound sound{format.sampleRate, std::vector<float>(count), std::vector<float>(count)};
  const size_t rightOffset = channels > 1 ? sampleBytes : 0;
  for (size_t i = 0; i < count; ++i) {
    sound.left[i] = read(bytes.data() + i * frameBytes);
    sound.right[i] = read(bytes.data() + i * frameBytes + rightOffset);
  }
  return sound;
}

void RateConverter::open(double rate) {
  inputRate_ = rate;
  AVChannelLayout stereo;
  av_channel_layout_default(&stereo, 2);
  SwrContext* context = nullptr;
  const int in = static_cast<int>(std::lround(rate));
  swr_alloc_set_opts2(&context, &stereo, AV_SAMPLE_FMT_FLTP, outputRate_, &stereo, AV_SAMPLE_FMT_FLTP, in, 0, nullptr);
  resampler_.reset(context);
  if (!resampler_ || swr_init(resampler_.get()) < 0) resampler_.reset();
}

void RateConverter::drain(const uint8_t** in, int count, StereoSound& out) {
  const int room = swr_get_out_samples(resampler_.get(), count);
  if (room <= 0) return;
  const size_t before = out.left.size();
  out.left.resize(before + static_cast<size_t>(room));
  out.right.resize(before + static_cast<size_t>(room));
  uint8_t* planes[2] = {reinterpret_cast<uint8_t*>(out.left.data() + before),
                        reinterpret_cast<uint8_t*>(out.right.data() + before)};
  const int got = std::max(0, swr_convert(resampler_.get(), planes, room, in, count));
  out.left.resize(before + static_cast<size_t>(got));
  out.right.resize(before + static_cast<size_t>(got));
}

void RateConverter::convert(const StereoSound& sound, int64_t from, int64_t count, StereoSound& out) {
  const float* left = sound.left.data() + from;
  const float* right = sound.right.data() + from;
  if (std::lround(sound.sampleRate) == outputRate_) {
    out.left.insert(out.left.end(), left, left + count);
    out.right.insert(out.right.end(), right, right + count);
    return;
  }
  if (!resampler_ || inputRate_ != sound.sampleRate) open(sound.sampleRate);
  if (!resampler_) return;
  const uint8_t* in[2] = {reinterpret_cast<const uint8_t*>(left), reinterpret_cast<const uint8_t*>(right)};
  drain(in, static_cast<int>(count), out);
}

void RateConverter::endRun(StereoSound& out) {
  if (!resampler_) return;
  drain(nullptr, 0, out);
  resampler_.reset();
}

}  // namespace qv::platform::ffmpeg
