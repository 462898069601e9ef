#include "platform/ffmpeg/SemiPlanarFrames.h"

#include <libyuv.h>

#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {

Result<AVFrame*> SemiPlanarFrames::unusedFrame(int width, int height) {
  for (const auto& frame : frames_) {
    if (av_frame_is_writable(frame.get())) return frame.get();
  }
  Frame frame(av_frame_alloc());
  frame->format = AV_PIX_FMT_NV12;
  frame->width = width;
  frame->height = height;
  const int made = av_frame_get_buffer(frame.get(), 0);
  if (made < 0) return mp4::movieError(mp4::kMovieEncoderFailed, "picture: " + errorText(made));
  frames_.emplace_back(std::move(frame));
  return frames_.back().get();
}

Result<Frame> SemiPlanarFrames::copy(const AVFrame& planar) {
  const auto unused = unusedFrame(planar.width, planar.height);
  if (!unused) return unused.error();
  AVFrame* out = unused.value();
  libyuv::I420ToNV12(planar.data[0], planar.linesize[0], planar.data[1], planar.linesize[1], planar.data[2],
                     planar.linesize[2], out->data[0], out->linesize[0], out->data[1], out->linesize[1], planar.width,
                     planar.height);
  return Frame(av_frame_clone(out));
}

}  // namespace qv::platform::ffmpeg
