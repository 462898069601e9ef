#pragma once

#include <cstdint>

#include "platform/Value.h"

namespace qv::platform::ffmpeg {

/// What a video input's output settings ask for, within what the encoder can do.
struct VideoSettings {
  int width = 0;  ///< even
  int height = 0;
  int64_t bitRate = 0;  ///< bits per second
  int frameRate = 60;
  int keyFrameInterval = 60;  ///< frames
};
/// Compression properties under other keys are logged and ignored.
VideoSettings parseVideoSettings(const Dictionary& outputSettings);

struct AudioSettings {
  int sampleRate = 44100;
  int64_t bitRate = 128000;
};
AudioSettings parseAudioSettings(const Dictionary& outputSettings);

}  // namespace qv::platform::ffmpeg
