#pragma once

#include <memory>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/FFmpegHandles.h"

namespace qv::platform::ffmpeg {

/// Copies pictures of three planes into ones of two, with the chroma interleaved (NV12), which is
/// what hardware takes. Memory is used again when an encoder has let go of it.
///
/// Threading: confined to one thread.
class SemiPlanarFrames {
 public:
  Result<Frame> copy(const AVFrame& planar);

 private:
  Result<AVFrame*> unusedFrame(int width, int height);
  // Shared, so that what holds this can be copied, as the content of a function must be.
  std::vector<std::shared_ptr<AVFrame>> frames_;
};

}  // namespace qv::platform::ffmpeg
