extern "C" {
#include <libavutil/hwcontext.h>
}

#include "platform/ffmpeg/H264Codec.h"
#include "platform/ffmpeg/SemiPlanarFrames.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

/// Surfaces for pictures: what the encoder refers to and what it works on.
constexpr int kSurfaces = 8;

struct BufferDeleter {
  void operator()(AVBufferRef* buffer) const { av_buffer_unref(&buffer); }
};
using Buffer = std::unique_ptr<AVBufferRef, BufferDeleter>;

Error deviceError(const char* what, int code) {
  return mp4::movieError(mp4::kMovieEncoderFailed, std::string(what) + ": " + errorText(code));
}

std::optional<Error> makeSurfaces(AVCodecContext& context, const std::string& node) {
  AVBufferRef* opened = nullptr;
  const int created = av_hwdevice_ctx_create(&opened, AV_HWDEVICE_TYPE_VAAPI, node.c_str(), nullptr, 0);
  const Buffer device(opened);
  if (created < 0) return deviceError("device", created);
  Buffer surfaces(av_hwframe_ctx_alloc(device.get()));
  if (!surfaces) return deviceError("surfaces", AVERROR(ENOMEM));
  auto& frames = *reinterpret_cast<AVHWFramesContext*>(surfaces->data);
  frames.format = AV_PIX_FMT_VAAPI;
  frames.sw_format = AV_PIX_FMT_NV12;
  frames.width = context.width;
  frames.height = context.height;
  frames.initial_pool_size = kSurfaces;
  const int made = av_hwframe_ctx_init(surfaces.get());
  if (made < 0) return deviceError("surfaces", made);
  context.hw_frames_ctx = surfaces.release();
  return std::nullopt;
}

Result<Frame> toSurface(const AVFrame& semiPlanar, AVBufferRef* surfaces) {
  Frame surface(av_frame_alloc());
  const int taken = av_hwframe_get_buffer(surfaces, surface.get(), 0);
  if (taken < 0) return deviceError("surface", taken);
  const int moved = av_hwframe_transfer_data(surface.get(), &semiPlanar, 0);
  if (moved < 0) return deviceError("upload", moved);
  return surface;
}

Result<FrameUpload> setUpVAAPI(AVCodecContext& context, const std::string& node) {
  context.pix_fmt = AV_PIX_FMT_VAAPI;
  if (auto error = makeSurfaces(context, node)) return *error;
  return FrameUpload(
      [frames = SemiPlanarFrames(), surfaces = context.hw_frames_ctx](const AVFrame& planar) mutable -> Result<Frame> {
        auto semiPlanar = frames.copy(planar);
        if (!semiPlanar) return semiPlanar.error();
        return toSurface(**semiPlanar, surfaces);
      });
}

}  // namespace

H264Codec vaapiCodec() {
  return {.name = "h264_vaapi", .nodes = "/dev/dri/renderD*", .oneNodeEach = true, .setUp = setUpVAAPI};
}

}  // namespace qv::platform::ffmpeg
