#pragma once

#include "sdk/c/Counted.h"
#include "sdk/c/quorvel/quorvel.h"
#include "sdk/common/quorvel/Types.h"

namespace qv::c {

/// A picture; it holds the daemon's frame until its last reference goes.
///
/// Threading: as Counted.
struct CVideoFrame final : Counted<quorvel_video_frame> {
  explicit CVideoFrame(quorvel::VideoFrame frame);
  const quorvel::VideoFrame kept;
};

/// A run of sound with its bytes.
///
/// Threading: as Counted.
struct CAudioSample final : Counted<quorvel_audio_sample> {
  explicit CAudioSample(quorvel::AudioSample sample);
  const quorvel::AudioSample kept;
};

}  // namespace qv::c
