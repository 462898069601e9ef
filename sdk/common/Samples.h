#pragma once

#include "protocol/SampleCoding.h"
#include "sdk/common/quorvel/Types.h"

namespace qv::sdk {

// Samples that have come, in the form for the libraries' users.

/// The pixels are mapped read-only, and given back with the frame's last copy.
[[nodiscard]] quorvel::VideoFrame videoFrame(const PictureMessage& picture);
/// Its presentation time is still that of its capture (SoundTimeline).
[[nodiscard]] quorvel::AudioSample audioSample(SoundMessage sound);
/// Of a numeric time.
[[nodiscard]] quorvel::SampleTime sampleTime(const platform::MediaTime& time);

}  // namespace qv::sdk
