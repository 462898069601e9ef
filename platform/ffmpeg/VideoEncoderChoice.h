#pragma once

#include <chrono>
#include <memory>
#include <vector>

#include "platform/ffmpeg/H264Codec.h"
#include "platform/ffmpeg/VideoEncoder.h"

namespace qv::platform::ffmpeg {

/// Which H.264 encoder records: the first that really encodes a picture. That an encoder is built in, or
/// that its device opens, tells little, so each is tried with one picture, once for the process.
/// The last, software, is taken untried: nothing stands behind it. One log line tells the choice,
/// and why the others fell.
///
/// Threading: thread-safe.
class VideoEncoderChoice {
 public:
  /// In order of preference; at least one. `patience` is how long a recording waits for the trial, from its first
  /// picture on. A driver that takes longer, or hangs, holds nothing up: that recording is encoded by the last
  /// candidate.
  VideoEncoderChoice(std::vector<H264Codec> candidates, std::chrono::milliseconds patience);

  /// Begins the trial, on the global queue. Returns at once; at once decided where no candidate has a device.
  void prepare();
  /// An encoder of the chosen kind; where it refuses these settings, of the next one that does not.
  Result<std::unique_ptr<VideoEncoder>> open(const VideoSettings& settings);

 private:
  struct State;
  const std::shared_ptr<State> state_;
};

}  // namespace qv::platform::ffmpeg
