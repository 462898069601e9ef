#include "platform/ffmpeg/H264Codec.h"

namespace qv::platform::ffmpeg {
namespace {

/// Below this quantiser a still screen only spends bits.
constexpr int kMinimumQuantiser = 10;
/// The fastest preset, with the tools back that a profile has: entropy coding, 8x8 transform, deblocking. With those of
/// High, quality of the next slower preset at three quarters of its time.
struct ProfileTools {
  int profile;
  const char* name;
  const char* tools;
};
constexpr ProfileTools kTools[] = {
    {FF_PROFILE_H264_CONSTRAINED_BASELINE, "baseline", "no-deblock=0:deblock=0,0:analyse=i4x4"},
    {FF_PROFILE_H264_MAIN, "main", "cabac=1:no-deblock=0:deblock=0,0:analyse=i4x4"},
    {FF_PROFILE_H264_HIGH, "high", "cabac=1:8x8dct=1:no-deblock=0:deblock=0,0:analyse=i4x4,i8x8"}};

Result<FrameUpload> setUpX264(AVCodecContext& context, const std::string&) {
  context.pix_fmt = AV_PIX_FMT_YUV420P;
  context.qmin = kMinimumQuantiser;
  context.thread_count = 0;
  av_opt_set(context.priv_data, "preset", "ultrafast", 0);
  av_opt_set(context.priv_data, "forced-idr", "1", 0);
  for (const ProfileTools& entry : kTools) {
    if (entry.profile != context.profile) continue;
    av_opt_set(context.priv_data, "profile", entry.name, 0);
    av_opt_set(context.priv_data, "x264-params", entry.tools, 0);
  }
  return FrameUpload();
}

}  // namespace

H264Codec x264Codec() { return {.name = "libx264", .canChangeRate = true, .setUp = setUpX264}; }

std::vector<H264Codec> h264Codecs() { return {vaapiCodec(), v4l2Codec(), x264Codec()}; }

}  // namespace qv::platform::ffmpeg
