#pragma once

#include <optional>

#include "platform/base/Value.h"
#include "sdk/common/quorvel/Types.h"

namespace qv::sdk {

// Samples as they cross a connection. What arrives may be malformed in ways that its wire type allows: such a sample
// is nothing.

/// Sample types on the wire.
inline constexpr int64_t kVideoSample = 1, kApplicationAudioSample = 2, kMicrophoneAudioSample = 3;

/// `frame` is the wire form of a shared frame object, `timing` the raw bytes of its timing. The pixels are mapped
/// read-only, and given back with the frame's last copy.
std::optional<quorvel::VideoFrame> videoFrameFromWire(const platform::Value& frame, const platform::Data& timing);

/// Of the raw bytes of a media time.
std::optional<quorvel::SampleTime> sampleTimeFromWire(const platform::Data& time);

/// The sample's presentation time is still that of its capture (SoundTimeline).
struct WireAudioSample {
  const platform::Data& bytes;
  const platform::Data& format;  ///< raw AudioStreamDescription
  int64_t numSamples;
  int64_t sampleType;
  const platform::Data& timing;  ///< raw SampleTimingInfo
};
std::optional<quorvel::AudioSample> audioSampleFromWire(const WireAudioSample& sample);

}  // namespace qv::sdk
