#include "platform/ffmpeg/VideoEncoder.h"

#include "platform/mp4/AnnexB.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

/// The interval of key frames counts frames; on a still screen few come, and a reader that seeks
/// would have to decode from far back.
constexpr int64_t kMaximumKeyFrameTicks = 2 * int64_t{mp4::kMovieTimescale};
/// Below this quantiser a still screen only spends bits.
constexpr int kMinimumQuantiser = 10;
/// The fastest preset, with the tools back that the High profile pays for: entropy coding, 8x8
/// transform, deblocking. Quality of the next slower preset at three quarters of its time.
constexpr const char kTools[] = "cabac=1:8x8dct=1:no-deblock=0:deblock=0,0:analyse=i4x4,i8x8";

CodecContext makeContext(const AVCodec* codec, const VideoSettings& settings) {
  CodecContext context(avcodec_alloc_context3(codec));
  context->width = settings.width;
  context->height = settings.height;
  context->pix_fmt = AV_PIX_FMT_YUV420P;
  context->time_base = {1, static_cast<int>(mp4::kMovieTimescale)};
  context->framerate = {settings.frameRate, 1};
  context->sample_aspect_ratio = {1, 1};
  context->bit_rate = settings.bitRate;
  // Without a bound, the first lively second after a still screen gets ten times its rate.
  context->rc_max_rate = settings.bitRate * 3 / 2;
  context->rc_buffer_size = static_cast<int>(settings.bitRate * 2);
  context->qmin = kMinimumQuantiser;
  context->gop_size = settings.keyFrameInterval;
  context->max_b_frames = 0;
  context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
  context->thread_count = 0;
  const mp4::ColorDescription color;
  context->color_primaries = static_cast<AVColorPrimaries>(color.primaries);
  context->color_trc = static_cast<AVColorTransferCharacteristic>(color.transfer);
  context->colorspace = static_cast<AVColorSpace>(color.matrix);
  context->color_range = AVCOL_RANGE_MPEG;
  av_opt_set(context->priv_data, "preset", "ultrafast", 0);
  av_opt_set(context->priv_data, "profile", "high", 0);
  av_opt_set(context->priv_data, "forced-idr", "1", 0);
  av_opt_set(context->priv_data, "x264-params", kTools, 0);
  return context;
}

Frame makeFrame(const AVCodecContext& context) {
  Frame frame(av_frame_alloc());
  frame->format = context.pix_fmt;
  frame->width = context.width;
  frame->height = context.height;
  return av_frame_get_buffer(frame.get(), 0) == 0 ? std::move(frame) : nullptr;
}

Error encoderError(const std::string& what, int code) {
  return mp4::movieError(mp4::kMovieEncoderFailed, what + ": " + errorText(code));
}

}  // namespace

Result<std::unique_ptr<VideoEncoder>> VideoEncoder::open(const VideoSettings& settings) {
  const AVCodec* codec = avcodec_find_encoder_by_name("libx264");
  if (codec == nullptr) return encoderError("H.264 encoder", AVERROR_ENCODER_NOT_FOUND);
  CodecContext context = makeContext(codec, settings);
  const int opened = avcodec_open2(context.get(), codec, nullptr);
  if (opened < 0) return encoderError("H.264 encoder", opened);
  std::unique_ptr<VideoEncoder> encoder(new VideoEncoder(settings, std::move(context)));
  if (!encoder->frame_) return encoderError("H.264 encoder", AVERROR(ENOMEM));
  return encoder;
}

VideoEncoder::VideoEncoder(const VideoSettings& settings, CodecContext context)
    : settings_(settings), context_(std::move(context)), frame_(makeFrame(*context_)), packet_(av_packet_alloc()) {}

mp4::MovieTrack VideoEncoder::track(uint32_t trackID, const AffineTransform& transform) const {
  const auto width = static_cast<uint32_t>(settings_.width);
  const auto height = static_cast<uint32_t>(settings_.height);
  mp4::MovieTrack track;
  track.trackID = trackID;
  track.kind = mp4::MovieTrack::Kind::Video;
  track.width = width;
  track.height = height;
  track.matrix = mp4::displayMatrix(transform, width, height);
  track.sampleEntry = mp4::makeAVCSampleEntry(
      width, height, mp4::makeAVCConfiguration({context_->extradata, static_cast<size_t>(context_->extradata_size)}),
      mp4::ColorDescription{});
  return track;
}

std::optional<Error> VideoEncoder::encode(const PixelBuffer& image, int64_t tick,
                                          std::vector<mp4::EncodedSample>& out) {
  if (const int writable = av_frame_make_writable(frame_.get()); writable < 0) return encoderError("picture", writable);
  PlanarPicture picture{settings_.width, settings_.height, {}, {}};
  for (int plane = 0; plane < 3; ++plane) {
    picture.planes[plane] = frame_->data[plane];
    picture.strides[plane] = frame_->linesize[plane];
  }
  converter_.convert(image, picture);
  return sendAt(*frame_, tick, out);
}

std::optional<Error> VideoEncoder::encode(const AVFrame& picture, int64_t tick, std::vector<mp4::EncodedSample>& out) {
  const Frame reference(av_frame_clone(&picture));
  if (!reference) return encoderError("picture", AVERROR(ENOMEM));
  return sendAt(*reference, tick, out);
}

std::optional<Error> VideoEncoder::sendAt(AVFrame& frame, int64_t tick, std::vector<mp4::EncodedSample>& out) {
  frame.pts = tick;
  const bool isLate = tick - lastKeyFrame_ >= kMaximumKeyFrameTicks;
  frame.pict_type = isLate ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
  if (isLate) lastKeyFrame_ = tick;
  return send(&frame, out);
}

std::optional<Error> VideoEncoder::flush(std::vector<mp4::EncodedSample>& out) { return send(nullptr, out); }

std::optional<Error> VideoEncoder::send(const AVFrame* frame, std::vector<mp4::EncodedSample>& out) {
  const int sent = avcodec_send_frame(context_.get(), frame);
  if (sent < 0) return encoderError("H.264 encoder", sent);
  receive(out);
  return std::nullopt;
}

void VideoEncoder::receive(std::vector<mp4::EncodedSample>& out) {
  while (avcodec_receive_packet(context_.get(), packet_.get()) == 0) {
    mp4::EncodedSample sample;
    sample.data = mp4::lengthPrefixed({packet_->data, static_cast<size_t>(packet_->size)});
    sample.decodeTime = packet_->pts;
    sample.duration = mp4::kMovieTimescale / static_cast<uint32_t>(settings_.frameRate);
    sample.isSync = (packet_->flags & AV_PKT_FLAG_KEY) != 0;
    if (sample.isSync) lastKeyFrame_ = std::max(lastKeyFrame_, packet_->pts);
    out.push_back(std::move(sample));
    av_packet_unref(packet_.get());
  }
}

}  // namespace qv::platform::ffmpeg
