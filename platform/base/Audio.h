#pragma once

#include <cstdint>
#include <memory>

namespace qv::platform {

constexpr uint32_t fourCharCode(const char (&code)[5]) {
  return uint32_t(uint8_t(code[0])) << 24 | uint32_t(uint8_t(code[1])) << 16 | uint32_t(uint8_t(code[2])) << 8 |
         uint32_t(uint8_t(code[3]));
}

inline constexpr uint32_t kAudioFormatLinearPCM = fourCharCode("lpcm");
inline constexpr uint32_t kAudioFormatMPEG4AAC = fourCharCode("aac ");

enum AudioFormatFlags : uint32_t {
  kAudioFormatFlagIsFloat = 1,
  kAudioFormatFlagIsBigEndian = 2,
  kAudioFormatFlagIsSignedInteger = 4,
  kAudioFormatFlagIsPacked = 8,
};

/// Describes a stream of audio. Its raw 40-byte layout crosses process boundaries.
struct AudioStreamDescription {
  double sampleRate = 0;  ///< frames per second
  uint32_t formatID = 0;
  uint32_t formatFlags = 0;
  uint32_t bytesPerPacket = 0;
  uint32_t framesPerPacket = 0;
  uint32_t bytesPerFrame = 0;
  uint32_t channelsPerFrame = 0;
  uint32_t bitsPerChannel = 0;
  uint32_t reserved = 0;
  bool operator==(const AudioStreamDescription&) const = default;
};
static_assert(sizeof(AudioStreamDescription) == 40, "crosses process boundaries as 40 raw bytes");

/// An immutable audio format. Without channel layout, cookie or extensions.
struct AudioFormatDescription {
  AudioStreamDescription streamDescription;
};
using AudioFormatDescriptionRef = std::shared_ptr<const AudioFormatDescription>;

struct SMPTETime {
  int16_t subframes = 0, subframeDivisor = 0;
  uint32_t counter = 0, type = 0, flags = 0;
  int16_t hours = 0, minutes = 0, seconds = 0, frames = 0;
};

/// When an audio buffer was captured. `hostTime` is in host clock units: nanoseconds of
/// CLOCK_MONOTONIC on this platform (see Clock.h for the conversion to MediaTime).
struct AudioTimeStamp {
  double sampleTime = 0;
  uint64_t hostTime = 0;
  double rateScalar = 0;
  uint64_t wordClockTime = 0;
  SMPTETime smpteTime;
  uint32_t flags = 0;
  uint32_t reserved = 0;
};

}  // namespace qv::platform
