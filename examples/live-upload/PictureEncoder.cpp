#include "PictureEncoder.h"

#include <algorithm>
#include <utility>

namespace upload {

namespace {

/// Bits for a pixel where the application names no rate: 2.8 Mbit/s for 1280x720 at 30.
constexpr double kBitsPerPixel = 0.1;

CodecContext makeContext(const AVCodec& codec, const Settings& settings, PictureSize size) {
  CodecContext context(avcodec_alloc_context3(&codec));
  context->width = size.width & ~1;
  context->height = size.height & ~1;
  context->pix_fmt = AV_PIX_FMT_YUV420P;
  context->time_base = kMicroseconds;
  context->framerate = {settings.frameRate, 1};
  const double rate = settings.videoBitRate > 0 ? settings.videoBitRate
                                                : kBitsPerPixel * context->width * context->height * settings.frameRate;
  context->bit_rate = static_cast<int64_t>(rate);
  // A live connection has no room for bursts: a second's worth at the most.
  context->rc_max_rate = context->bit_rate;
  context->rc_buffer_size = static_cast<int>(context->bit_rate);
  context->gop_size = std::max(1, static_cast<int>(settings.keyFrameInterval * settings.frameRate));
  context->max_b_frames = 0;
  context->colorspace = AVCOL_SPC_BT709;
  context->color_primaries = AVCOL_PRI_BT709;
  context->color_trc = AVCOL_TRC_BT709;
  context->color_range = AVCOL_RANGE_MPEG;
  av_opt_set(context->priv_data, "preset", "superfast", 0);
  av_opt_set(context->priv_data, "tune", "zerolatency", 0);
  av_opt_set(context->priv_data, "forced-idr", "1", 0);
  return context;
}

}  // namespace

std::unique_ptr<PictureEncoder> PictureEncoder::open(const Settings& settings, PictureSize size, bool hasGlobalHeader) {
  const AVCodec* codec = avcodec_find_encoder_by_name("libx264");
  if (codec == nullptr || size.width < 2 || size.height < 2) return nullptr;
  CodecContext context = makeContext(*codec, settings, size);
  if (hasGlobalHeader) context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
  if (avcodec_open2(context.get(), codec, nullptr) < 0) return nullptr;
  std::unique_ptr<PictureEncoder> encoder(
      new PictureEncoder(std::move(context), static_cast<int64_t>(settings.keyFrameInterval * 1e6)));
  AVFrame& picture = *encoder->picture_;
  picture.format = encoder->context_->pix_fmt;
  picture.width = encoder->context_->width;
  picture.height = encoder->context_->height;
  return av_frame_get_buffer(&picture, 0) == 0 ? std::move(encoder) : nullptr;
}

PictureEncoder::PictureEncoder(CodecContext context, int64_t keyFrameInterval)
    : context_(std::move(context)), picture_(av_frame_alloc()), keyFrameInterval_(keyFrameInterval) {}

void PictureEncoder::encode(const quorvel::VideoFrame& frame, quorvel::Orientation orientation, int64_t time,
                            bool asKeyFrame, const std::function<void(Packet)>& output) {
  if (av_frame_make_writable(picture_.get()) < 0 || !converter_.convert(frame, orientation, *picture_)) return;
  // By time too: on a still screen few pictures come, and a viewer who joins waits for a key frame.
  const bool isKey = asKeyFrame || time - lastKeyFrame_ >= keyFrameInterval_;
  picture_->pict_type = isKey ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
  picture_->pts = time;
  if (avcodec_send_frame(context_.get(), picture_.get()) < 0) return;
  for (Packet packet(av_packet_alloc()); avcodec_receive_packet(context_.get(), packet.get()) == 0;
       packet.reset(av_packet_alloc())) {
    if ((packet->flags & AV_PKT_FLAG_KEY) != 0) lastKeyFrame_ = packet->pts;
    output(std::move(packet));
  }
}

}  // namespace upload
