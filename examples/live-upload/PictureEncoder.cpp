#include "PictureEncoder.h"

#include <algorithm>
#include <utility>

extern "C" {
#include <libswscale/swscale.h>
}

namespace upload {

namespace {

/// Bits for a pixel where the application names no rate: 2.8 Mbit/s for 1280x720 at 30.
constexpr double kBitsPerPixel = 0.1;

CodecContext makeContext(const AVCodec& codec, const Settings& settings, uint32_t width, uint32_t height) {
  CodecContext context(avcodec_alloc_context3(&codec));
  context->width = static_cast<int>(width & ~1u);
  context->height = static_cast<int>(height & ~1u);
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

std::unique_ptr<PictureEncoder> PictureEncoder::open(const Settings& settings, uint32_t width, uint32_t height,
                                                     bool hasGlobalHeader) {
  const AVCodec* codec = avcodec_find_encoder_by_name("libx264");
  if (codec == nullptr || width < 2 || height < 2) return nullptr;
  CodecContext context = makeContext(*codec, settings, width, height);
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

PictureEncoder::~PictureEncoder() { sws_freeContext(scaler_); }

bool PictureEncoder::convert(const quorvel::VideoFrame& frame) {
  if (av_frame_make_writable(picture_.get()) < 0) return false;
  scaler_ = sws_getCachedContext(scaler_, static_cast<int>(frame.width), static_cast<int>(frame.height),
                                 AV_PIX_FMT_BGR0, context_->width, context_->height, context_->pix_fmt,
                                 SWS_FAST_BILINEAR, nullptr, nullptr, nullptr);
  if (scaler_ == nullptr) return false;
  sws_setColorspaceDetails(scaler_, sws_getCoefficients(SWS_CS_ITU709), 1, sws_getCoefficients(SWS_CS_ITU709), 0, 0,
                           1 << 16, 1 << 16);
  const uint8_t* const planes[] = {frame.pixels.data()};
  const int strides[] = {static_cast<int>(frame.stride)};
  return sws_scale(scaler_, planes, strides, 0, static_cast<int>(frame.height), picture_->data, picture_->linesize) > 0;
}

void PictureEncoder::encode(const quorvel::VideoFrame& frame, int64_t time, bool asKeyFrame,
                            const std::function<void(Packet)>& output) {
  if (!convert(frame)) return;
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
