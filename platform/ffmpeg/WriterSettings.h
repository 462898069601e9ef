#pragma once

#include <cstdint>

#include "platform/base/Value.h"

namespace qv::platform::ffmpeg {

enum class H264Profile { Baseline, Main, High };

/// What a video input's output settings ask for, within what the encoder can do.
struct VideoSettings {
  int width = 0;  ///< even
  int height = 0;
  int64_t bitRate = 0;  ///< bits per second
  int frameRate = 60;
  int keyFrameInterval = 60;  ///< frames
  H264Profile profile = H264Profile::High;
};
/// Says in the log what it cannot follow: properties under other keys, in one line, unknown profiles, and levels, since
/// a level follows from size and rate.
VideoSettings parseVideoSettings(const Dictionary& outputSettings);

struct AudioSettings {
  int sampleRate = 44100;
  int64_t bitRate = 128000;
};
AudioSettings parseAudioSettings(const Dictionary& outputSettings);

}  // namespace qv::platform::ffmpeg
