#pragma once

#include <functional>
#include <string>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/FFmpegHandles.h"
#include "platform/ffmpeg/WriterSettings.h"

namespace qv::platform::ffmpeg {

/// Brings a picture of three 4:2:0 planes to where an encoder takes it from.
using FrameUpload = std::function<Result<Frame>(const AVFrame& planar)>;

/// One of libavcodec's H.264 encoders, and what is particular to it.
///
/// Threading: immutable; `setUp` may be called on any thread, its FrameUpload belongs to the encoder's.
struct H264Codec {
  /// libavcodec's name of it.
  std::string name;
  /// The device nodes of which it needs one, as a glob pattern; empty where it needs none.
  std::string nodes = {};
  /// Each node is a device of its own; otherwise the encoder finds its way among them.
  bool oneNodeEach = false;
  /// Its rate can be changed while it runs.
  bool canChangeRate = false;
  /// Fills in the rest of a context that has size, rate, profile, times and colours already. Gives an empty
  /// function where the encoder takes the planes as they are.
  std::function<Result<FrameUpload>(AVCodecContext& context, const std::string& node)> setUp;
};

/// Software; needs nothing.
H264Codec x264Codec();
/// The media engines of graphics processors.
H264Codec vaapiCodec();
/// The stateful video encoders of many systems on a chip.
H264Codec v4l2Codec();
/// All of them, the most wanted first; the last one is software.
std::vector<H264Codec> h264Codecs();

}  // namespace qv::platform::ffmpeg
