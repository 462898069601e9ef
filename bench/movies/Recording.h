#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/AssetWriter.h"
#include "platform/base/SampleBuffer.h"

namespace qv::bench {

/// A recording by the real writer and encoders, as fast as they go.
struct RecordingPlan {
  uint32_t width = 1280, height = 720;
  int picturesPerSecond = 60;
  int64_t bitRate = 3'000'000;  ///< per second
  double seconds = 3;
  /// From then on only the heartbeat of a still screen comes, twice a second.
  double stillFrom = 1e9;
};
struct Recorded {
  double processorSeconds = 0;
  double finishMilliseconds = 0;
};

/// A textured scene that moves and turns, so that the encoder has something to do.
std::vector<platform::PixelBufferRef> makeScene(uint32_t width, uint32_t height);
platform::Dictionary videoSettings(const RecordingPlan& plan);
double processorSeconds();
Recorded recordMovie(const std::string& path, const RecordingPlan& plan,
                     const std::vector<platform::PixelBufferRef>& scene);

}  // namespace qv::bench
