#include "platform/ffmpeg/VideoEncoder.h"

#include <algorithm>
#include <cstring>

#include "platform/mp4/AnnexB.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

/// The interval of key frames counts frames; on a still screen few come, and a reader that seeks
/// would have to decode from far back.
constexpr int64_t kMaximumKeyFrameTicks = 2 * int64_t{mp4::kMovieTimescale};
/// Pictures that come as slowly as this, a few in a row, come from the heartbeat of a still screen.
constexpr int64_t kSlowInterval = int64_t{mp4::kMovieTimescale} * 3 / 10;
constexpr int kSlowPictures = 2;
/// What a still screen may take, bits per second and, for its key frames, bits at once.
constexpr int64_t kStillRate = 140'000;
constexpr int kStillBuffer = 280'000;
constexpr int kGrey = 128;
constexpr AffineTransform kQuarterTurnClockwise{0, 1, -1, 0, 0, 0};

/// Without a bound, the first lively second after a still screen gets ten times its rate.
int64_t maximumRate(const VideoSettings& settings) { return settings.bitRate * 3 / 2; }
int rateBuffer(const VideoSettings& settings) { return static_cast<int>(settings.bitRate * 2); }

int libraryProfile(H264Profile profile) {
  switch (profile) {
    case H264Profile::Baseline:
      return FF_PROFILE_H264_CONSTRAINED_BASELINE;
    case H264Profile::Main:
      return FF_PROFILE_H264_MAIN;
    case H264Profile::High:
      break;
  }
  return FF_PROFILE_H264_HIGH;
}

CodecContext makeContext(const AVCodec* codec, const VideoSettings& settings) {
  CodecContext context(avcodec_alloc_context3(codec));
  context->width = settings.width;
  context->height = settings.height;
  context->time_base = {1, static_cast<int>(mp4::kMovieTimescale)};
  context->framerate = {settings.frameRate, 1};
  context->sample_aspect_ratio = {1, 1};
  context->bit_rate = settings.bitRate;
  context->rc_max_rate = maximumRate(settings);
  context->rc_buffer_size = rateBuffer(settings);
  context->gop_size = settings.keyFrameInterval;
  context->max_b_frames = 0;
  context->profile = libraryProfile(settings.profile);
  context->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
  const mp4::ColorDescription color;
  context->color_primaries = static_cast<AVColorPrimaries>(color.primaries);
  context->color_trc = static_cast<AVColorTransferCharacteristic>(color.transfer);
  context->colorspace = static_cast<AVColorSpace>(color.matrix);
  context->color_range = AVCOL_RANGE_MPEG;
  return context;
}

Frame makePlanarFrame(const VideoSettings& settings) {
  Frame frame(av_frame_alloc());
  frame->format = AV_PIX_FMT_YUV420P;
  frame->width = settings.width;
  frame->height = settings.height;
  return av_frame_get_buffer(frame.get(), 0) == 0 ? std::move(frame) : nullptr;
}

Error encoderError(const std::string& what, int code) {
  return mp4::movieError(mp4::kMovieEncoderFailed, what + ": " + errorText(code));
}

}  // namespace

Result<std::unique_ptr<VideoEncoder>> VideoEncoder::openCodec(const H264Codec& codec, const std::string& node,
                                                              const VideoSettings& settings) {
  const AVCodec* found = avcodec_find_encoder_by_name(codec.name.c_str());
  if (found == nullptr) return encoderError(codec.name, AVERROR_ENCODER_NOT_FOUND);
  CodecContext context = makeContext(found, settings);
  auto upload = codec.setUp(*context, node);
  if (!upload) return upload.error();
  const int opened = avcodec_open2(context.get(), found, nullptr);
  if (opened < 0) return encoderError("open", opened);
  std::unique_ptr<VideoEncoder> encoder(
      new VideoEncoder(settings, std::move(context), std::move(upload.value()), codec.canChangeRate));
  if (!encoder->frame_) return encoderError("picture", AVERROR(ENOMEM));
  return encoder;
}

Result<std::unique_ptr<VideoEncoder>> VideoEncoder::open(const H264Codec& codec, const std::string& node,
                                                         const VideoSettings& settings) {
  auto encoder = openCodec(codec, node, settings);
  if (!encoder || !encoder.value()->configuration_.empty()) return encoder;
  // The movie's header comes before its first picture: another encoder of the same settings tells.
  auto configuration = encodeTrial(codec, node, settings);
  if (!configuration) return configuration.error();
  encoder.value()->configuration_ = std::move(*configuration);
  return encoder;
}

Result<std::unique_ptr<VideoEncoder>> VideoEncoder::open(const VideoSettings& settings) {
  return open(x264Codec(), {}, settings);
}

/// Gives the decoder configuration, which some encoders have only in their first packet.
Result<std::vector<uint8_t>> VideoEncoder::encodeTrial(const H264Codec& codec, const std::string& node,
                                                       const VideoSettings& settings) {
  auto opened = openCodec(codec, node, settings);
  if (!opened) return opened.error();
  VideoEncoder& encoder = **opened;
  const AVFrame& picture = *encoder.frame_;
  for (int plane = 0; plane < 3; ++plane) {
    const int rows = plane == 0 ? picture.height : picture.height / 2;
    std::memset(picture.data[plane], kGrey, static_cast<size_t>(picture.linesize[plane]) * static_cast<size_t>(rows));
  }
  std::vector<mp4::EncodedSample> samples;
  if (auto error = encoder.encode(picture, 0, samples)) return *error;
  if (auto error = encoder.flush(samples)) return *error;
  if (samples.empty() || samples[0].data.empty() || !samples[0].isSync) {
    return mp4::movieError(mp4::kMovieEncoderFailed, "no key frame came out");
  }
  if (encoder.configuration_.empty()) return mp4::movieError(mp4::kMovieEncoderFailed, "no parameter sets came out");
  return std::move(encoder.configuration_);
}

std::optional<Error> VideoEncoder::tryOut(const H264Codec& codec, const std::string& node,
                                          const VideoSettings& settings) {
  const auto configuration = encodeTrial(codec, node, settings);
  return configuration ? std::nullopt : std::optional(configuration.error());
}

VideoEncoder::VideoEncoder(const VideoSettings& settings, CodecContext context, FrameUpload upload, bool canChangeRate)
    : settings_(settings),
      canChangeRate_(canChangeRate),
      context_(std::move(context)),
      upload_(std::move(upload)),
      frame_(makePlanarFrame(settings)),
      packet_(av_packet_alloc()),
      configuration_(mp4::makeAVCConfiguration({context_->extradata, static_cast<size_t>(context_->extradata_size)})) {}

std::string VideoEncoder::name() const { return context_->codec->name; }

bool VideoEncoder::liesAcross(const PixelBuffer& image) const {
  const FrameLayout& layout = image.sharedFrame()->layout();
  return (layout.width > layout.height && settings_.width < settings_.height) ||
         (layout.width < layout.height && settings_.width > settings_.height);
}

mp4::MovieTrack VideoEncoder::track(uint32_t trackID, const AffineTransform& transform) const {
  const auto width = static_cast<uint32_t>(settings_.width);
  const auto height = static_cast<uint32_t>(settings_.height);
  mp4::MovieTrack track;
  track.trackID = trackID;
  track.kind = mp4::MovieTrack::Kind::Video;
  track.width = width;
  track.height = height;
  track.matrix =
      mp4::displayMatrix(isTurned_ ? concatenate(kQuarterTurnClockwise, transform) : transform, width, height);
  track.sampleEntry = mp4::makeAVCSampleEntry(width, height, configuration_, mp4::ColorDescription{});
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
  isTurned_ ? converter_.convertTurned(image, picture) : converter_.convert(image, picture);
  return encode(*frame_, tick, out);
}

std::optional<Error> VideoEncoder::encode(const AVFrame& picture, int64_t tick, std::vector<mp4::EncodedSample>& out) {
  if (upload_) {
    auto uploaded = upload_(picture);
    return uploaded ? sendAt(std::move(*uploaded), tick, out) : uploaded.error();
  }
  Frame reference(av_frame_clone(&picture));
  if (!reference) return encoderError("picture", AVERROR(ENOMEM));
  return sendAt(std::move(reference), tick, out);
}

std::optional<Error> VideoEncoder::sendAt(Frame frame, int64_t tick, std::vector<mp4::EncodedSample>& out) {
  adaptRate(tick);
  frame->pts = tick;
  const bool isLate = tick - lastKeyFrame_ >= kMaximumKeyFrameTicks;
  frame->pict_type = isLate ? AV_PICTURE_TYPE_I : AV_PICTURE_TYPE_NONE;
  if (isLate) lastKeyFrame_ = tick;
  return send(frame.get(), out);
}

void VideoEncoder::adaptRate(int64_t tick) {
  slowPictures_ = tick - lastTick_ >= kSlowInterval ? slowPictures_ + 1 : 0;
  lastTick_ = tick;
  if (!canChangeRate_) return;
  const bool isStill = slowPictures_ >= kSlowPictures;
  context_->rc_max_rate = isStill ? std::min(kStillRate, maximumRate(settings_)) : maximumRate(settings_);
  context_->rc_buffer_size = isStill ? std::min(kStillBuffer, rateBuffer(settings_)) : rateBuffer(settings_);
}

std::optional<Error> VideoEncoder::flush(std::vector<mp4::EncodedSample>& out) { return send(nullptr, out); }

std::optional<Error> VideoEncoder::send(const AVFrame* frame, std::vector<mp4::EncodedSample>& out) {
  int sent = AVERROR(EAGAIN);
  while (sent == AVERROR(EAGAIN)) {  // full: it takes more when something was taken from it
    const size_t before = out.size();
    sent = avcodec_send_frame(context_.get(), frame);
    if (sent < 0 && sent != AVERROR(EAGAIN)) return encoderError("H.264 encoder", sent);
    if (auto error = receive(out)) return error;
    if (sent == AVERROR(EAGAIN) && out.size() == before) return encoderError("H.264 encoder", sent);
  }
  return std::nullopt;
}

std::optional<Error> VideoEncoder::receive(std::vector<mp4::EncodedSample>& out) {
  for (;;) {
    const int received = avcodec_receive_packet(context_.get(), packet_.get());
    if (received == AVERROR(EAGAIN) || received == AVERROR_EOF) return std::nullopt;
    if (received < 0) return encoderError("H.264 encoder", received);
    if (auto error = checkParameterSets(*packet_)) return error;
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

/// A movie has its parameter sets once, in the header; pictures of other ones could not be decoded.
std::optional<Error> VideoEncoder::checkParameterSets(const AVPacket& packet) {
  if ((packet.flags & AV_PKT_FLAG_KEY) == 0) return std::nullopt;
  auto configuration = mp4::makeAVCConfiguration({packet.data, static_cast<size_t>(packet.size)});
  if (configuration.empty()) return std::nullopt;
  if (configuration_.empty())
    configuration_ = std::move(configuration);
  else if (configuration != configuration_)
    return mp4::movieError(mp4::kMovieEncoderFailed, "H.264 encoder: its parameter sets have changed");
  return std::nullopt;
}

}  // namespace qv::platform::ffmpeg
