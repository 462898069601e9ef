#include "SoundMixer.h"

#include <algorithm>
#include <bit>
#include <cstdlib>
#include <cstring>

extern "C" {
#include <libavutil/channel_layout.h>
#include <libswresample/swresample.h>
}

namespace upload {

namespace {

constexpr int64_t kLongestWait = 300 * kSoundRate / 1000;   // for a source that has nothing to say
constexpr int64_t kTolerance = 20 * kSoundRate / 1000;      // of times, before sound is placed anew
constexpr int64_t kLongestAhead = int64_t{4} * kSoundRate;  // a time beyond this is a mistake

int64_t samplesAt(int64_t microseconds) { return microseconds * kSoundRate / 1'000'000; }

AVSampleFormat sampleFormat(const quorvel::AudioFormat& format) {
  if (format.isFloat) return format.bitsPerChannel == 32 ? AV_SAMPLE_FMT_FLT : AV_SAMPLE_FMT_NONE;
  if (!format.isSigned) return AV_SAMPLE_FMT_NONE;
  return format.bitsPerChannel == 16   ? AV_SAMPLE_FMT_S16
         : format.bitsPerChannel == 32 ? AV_SAMPLE_FMT_S32
                                       : AV_SAMPLE_FMT_NONE;
}

bool isSame(const quorvel::AudioFormat& a, const quorvel::AudioFormat& b) {
  return a.sampleRate == b.sampleRate && a.channels == b.channels && sampleFormat(a) == sampleFormat(b);
}

SwrContext* makeResampler(const quorvel::AudioFormat& format) {
  const bool isPacked = format.bytesPerFrame == format.channels * format.bitsPerChannel / 8;
  if (sampleFormat(format) == AV_SAMPLE_FMT_NONE || !isPacked || format.channels < 1 || format.channels > 8 ||
      format.sampleRate < 4000 || format.sampleRate > 384'000)
    return nullptr;
  AVChannelLayout in, out = AV_CHANNEL_LAYOUT_STEREO;
  av_channel_layout_default(&in, static_cast<int>(format.channels));
  SwrContext* resampler = nullptr;
  if (swr_alloc_set_opts2(&resampler, &out, AV_SAMPLE_FMT_FLT, kSoundRate, &in, sampleFormat(format),
                          static_cast<int>(format.sampleRate), 0, nullptr) == 0 &&
      swr_init(resampler) < 0)
    swr_free(&resampler);
  av_channel_layout_uninit(&in);
  return resampler;
}

std::vector<uint8_t> nativeOrder(const quorvel::AudioSample& sample) {
  std::vector<uint8_t> bytes = sample.bytes;
  if (sample.format.isBigEndian == (std::endian::native == std::endian::big)) return bytes;
  const size_t width = sample.format.bitsPerChannel / 8;
  for (size_t at = 0; at + width <= bytes.size(); at += width)
    std::reverse(bytes.begin() + static_cast<ptrdiff_t>(at), bytes.begin() + static_cast<ptrdiff_t>(at + width));
  return bytes;
}

}  // namespace

SoundMixer::~SoundMixer() {
  for (Source& source : sources_) swr_free(&source.resampler);
}

std::vector<float> SoundMixer::resample(Source& source, const quorvel::AudioSample& sample) {
  const std::vector<uint8_t> bytes = nativeOrder(sample);
  const uint8_t* input[] = {bytes.data()};
  const auto count = static_cast<int>(std::min<int64_t>(sample.frameCount, 1 << 20));
  std::vector<float> frames(2 * static_cast<size_t>(swr_get_out_samples(source.resampler, count)));
  uint8_t* output[] = {reinterpret_cast<uint8_t*>(frames.data())};
  const int made = swr_convert(source.resampler, output, static_cast<int>(frames.size() / 2), input, count);
  frames.resize(2 * static_cast<size_t>(std::max(made, 0)));
  return frames;
}

void SoundMixer::add(const quorvel::AudioSample& sample, int64_t time) {
  Source& source = sources_[sample.source == quorvel::AudioSample::Source::Microphone ? 1 : 0];
  const int64_t position = samplesAt(time);
  if (position > latest_ + kLongestAhead) return;
  const bool goesOn = source.resampler && isSame(source.format, sample.format) && source.next &&
                      std::llabs(*source.next - position) < kTolerance;
  if (!goesOn) {
    swr_free(&source.resampler);
    source.resampler = makeResampler(sample.format);
    source.format = sample.format;
    source.next = position;
  }
  if (source.resampler == nullptr) {
    source.next.reset();
    return;
  }
  const std::vector<float> frames = resample(source, sample);
  mix(*source.next, frames);
  *source.next += static_cast<int64_t>(frames.size() / 2);
  latest_ = std::max(latest_, *source.next);
}

/// What lies before the chunks that were taken comes too late, and is left out.
void SoundMixer::mix(int64_t position, const std::vector<float>& frames) {
  const auto count = static_cast<int64_t>(frames.size() / 2);
  const int64_t end = position + count;
  if (end <= start_) return;
  if (mixed_.size() < 2 * static_cast<size_t>(end - start_)) mixed_.resize(2 * static_cast<size_t>(end - start_));
  for (int64_t at = 2 * std::max(position, start_); at < 2 * end; ++at)
    mixed_[static_cast<size_t>(at - 2 * start_)] += frames[static_cast<size_t>(at - 2 * position)];
}

void SoundMixer::notePicture(int64_t time) { latest_ = std::max(latest_, samplesAt(time)); }

bool SoundMixer::isReady(int64_t end) const {
  if (latest_ - kLongestWait >= end) return true;
  bool isHeard = false;
  for (const Source& source : sources_) {
    if (!source.next) continue;
    if (*source.next < end) return false;
    isHeard = true;
  }
  return isHeard;
}

std::optional<SoundMixer::Chunk> SoundMixer::take() {
  if (!isReady(start_ + kChunkSamples)) return std::nullopt;
  Chunk chunk{start_, std::vector<float>(2 * kChunkSamples)};
  const size_t count = std::min(mixed_.size(), chunk.frames.size());
  for (size_t i = 0; i < count; ++i) chunk.frames[i] = std::clamp(mixed_[i], -1.0f, 1.0f);
  mixed_.erase(mixed_.begin(), mixed_.begin() + static_cast<ptrdiff_t>(count));
  start_ += kChunkSamples;
  return chunk;
}

}  // namespace upload
