#include "platform/ffmpeg/H264Codec.h"
#include "platform/ffmpeg/SemiPlanarFrames.h"

namespace qv::platform::ffmpeg {
namespace {

Result<FrameUpload> setUpV4L2(AVCodecContext& context, const std::string&) {
  context.pix_fmt = AV_PIX_FMT_NV12;  // what these devices have in common
  return FrameUpload([frames = SemiPlanarFrames()](const AVFrame& planar) mutable { return frames.copy(planar); });
}

}  // namespace

H264Codec v4l2Codec() { return {.name = "h264_v4l2m2m", .nodes = "/dev/video*", .setUp = setUpV4L2}; }

}  // namespace qv::platform::ffmpeg
