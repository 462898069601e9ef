#pragma once

#include <quorvel/Types.h>

#include <array>
#include <cstdint>
#include <optional>
#include <vector>

struct SwrContext;

namespace upload {

inline constexpr int kSoundRate = 48'000;  ///< samples a second, in each of two channels
inline constexpr int kChunkSamples = 1024;

/// Brings the application's sound and the microphone's onto one timeline, by the times of their samples: a gap becomes
/// silence, what overlaps is mixed.
///
/// Threading: one thread. Times in microseconds of the stream.
class SoundMixer {
 public:
  struct Chunk {
    int64_t position;           ///< in samples of the stream
    std::vector<float> frames;  ///< kChunkSamples, two interleaved channels
  };

  SoundMixer() = default;
  ~SoundMixer();
  SoundMixer(const SoundMixer&) = delete;
  SoundMixer& operator=(const SoundMixer&) = delete;

  /// Sound of a format that we cannot read is left out.
  void add(const quorvel::AudioSample& sample, int64_t time);
  /// The pictures have come to `time`.
  void notePicture(int64_t time);
  /// The next chunk, once all sources that were heard have come past it, or are too late for it.
  [[nodiscard]] std::optional<Chunk> take();

 private:
  struct Source {
    SwrContext* resampler = nullptr;
    quorvel::AudioFormat format;
    std::optional<int64_t> next;  // where its sound goes on, in samples; nothing before the first
  };
  [[nodiscard]] std::vector<float> resample(Source& source, const quorvel::AudioSample& sample);
  void mix(int64_t position, const std::vector<float>& frames);
  [[nodiscard]] bool isReady(int64_t end) const;

  std::array<Source, 2> sources_;
  std::vector<float> mixed_;  // from start_ on, two interleaved channels
  int64_t start_ = 0, latest_ = 0;
};

}  // namespace upload
