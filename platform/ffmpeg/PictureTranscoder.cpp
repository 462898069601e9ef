#include "platform/ffmpeg/PictureTranscoder.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

/// Bits per pixel and frame at which a re-encoded film cannot be told from its source.
constexpr double kGenerousBitsPerPixel = 0.2;

Error transcodeError(const char* what, int code) {
  return mp4::movieError(mp4::kMovieNotReadable, std::string("video: ") + what + ": " + errorText(code));
}

VideoSettings settingsFor(const AVStream& stream) {
  const double rate =
      std::clamp(av_q2d(stream.avg_frame_rate.den > 0 ? stream.avg_frame_rate : AVRational{30, 1}), 1.0, 240.0);
  VideoSettings settings;
  settings.width = stream.codecpar->width + stream.codecpar->width % 2;
  settings.height = stream.codecpar->height + stream.codecpar->height % 2;
  settings.frameRate = static_cast<int>(std::lround(rate));
  settings.keyFrameInterval = settings.frameRate * 2;
  settings.bitRate = std::max<int64_t>(
      500'000, std::llround(kGenerousBitsPerPixel * settings.width * settings.height * settings.frameRate));
  return settings;
}

}  // namespace

Result<std::unique_ptr<PictureTranscoder>> PictureTranscoder::create(const AVStream& stream, const ExportRange& range) {
  std::unique_ptr<PictureTranscoder> transcoder(new PictureTranscoder);
  transcoder->range_ = range;
  transcoder->frame_.reset(av_frame_alloc());
  if (auto error = transcoder->openDecoder(stream)) return *error;
  const VideoSettings settings = settingsFor(stream);
  if (auto error = transcoder->buildGraph(stream, settings.width, settings.height)) return *error;
  auto encoder = VideoEncoder::open(settings);
  if (!encoder) return encoder.error();
  transcoder->encoder_ = std::move(*encoder);
  size_t size = 0;
  const uint8_t* matrix = av_stream_get_side_data(&stream, AV_PKT_DATA_DISPLAYMATRIX, &size);
  if (matrix && size >= 36) std::copy_n(reinterpret_cast<const int32_t*>(matrix), 9, transcoder->matrix_.begin());
  return transcoder;
}

std::optional<Error> PictureTranscoder::openDecoder(const AVStream& stream) {
  const AVCodec* codec = avcodec_find_decoder(stream.codecpar->codec_id);
  if (codec == nullptr) return transcodeError("decoder", AVERROR_DECODER_NOT_FOUND);
  decoder_.reset(avcodec_alloc_context3(codec));
  avcodec_parameters_to_context(decoder_.get(), stream.codecpar);
  decoder_->pkt_timebase = stream.time_base;
  const int opened = avcodec_open2(decoder_.get(), codec, nullptr);
  if (opened < 0) return transcodeError("decoder", opened);
  return std::nullopt;
}

std::optional<Error> PictureTranscoder::buildGraph(const AVStream& stream, int width, int height) {
  graph_.reset(avfilter_graph_alloc());
  char text[256];
  std::snprintf(text, sizeof text, "video_size=%dx%d:pix_fmt=%d:time_base=%d/%d:pixel_aspect=1/1",
                stream.codecpar->width, stream.codecpar->height, stream.codecpar->format, stream.time_base.num,
                stream.time_base.den);
  int made = avfilter_graph_create_filter(&entry_, avfilter_get_by_name("buffer"), "in", text, nullptr, graph_.get());
  AVFilterContext* scale = nullptr;
  std::snprintf(text, sizeof text, "%d:%d:out_color_matrix=bt601:out_range=tv", width, height);
  if (made >= 0) {
    made = avfilter_graph_create_filter(&scale, avfilter_get_by_name("scale"), "scale", text, nullptr, graph_.get());
  }
  AVFilterContext* format = nullptr;
  if (made >= 0) {
    made = avfilter_graph_create_filter(&format, avfilter_get_by_name("format"), "format", "yuv420p", nullptr,
                                        graph_.get());
  }
  if (made >= 0) {
    made = avfilter_graph_create_filter(&converted_, avfilter_get_by_name("buffersink"), "out", nullptr, nullptr,
                                        graph_.get());
  }
  if (made >= 0) made = avfilter_link(entry_, 0, scale, 0);
  if (made >= 0) made = avfilter_link(scale, 0, format, 0);
  if (made >= 0) made = avfilter_link(format, 0, converted_, 0);
  if (made >= 0) made = avfilter_graph_config(graph_.get(), nullptr);
  if (made < 0) return transcodeError("graph", made);
  return std::nullopt;
}

mp4::MovieTrack PictureTranscoder::track(uint32_t trackID) const {
  mp4::MovieTrack track = encoder_->track(trackID, AffineTransform::identity());
  track.matrix = matrix_;
  return track;
}

std::optional<Error> PictureTranscoder::add(const AVPacket& packet, std::vector<mp4::EncodedSample>& out) {
  return decode(&packet, out);
}

std::optional<Error> PictureTranscoder::finish(std::vector<mp4::EncodedSample>& out) {
  if (auto error = decode(nullptr, out)) return error;
  return encoder_->flush(out);
}

std::optional<Error> PictureTranscoder::decode(const AVPacket* packet, std::vector<mp4::EncodedSample>& out) {
  const int sent = avcodec_send_packet(decoder_.get(), packet);
  if (sent < 0 && sent != AVERROR_INVALIDDATA && sent != AVERROR_EOF) return transcodeError("decoder", sent);
  while (avcodec_receive_frame(decoder_.get(), frame_.get()) == 0) {
    frame_->pts = frame_->best_effort_timestamp;
    const int taken = av_buffersrc_add_frame(entry_, frame_.get());
    if (taken < 0) return transcodeError("source", taken);
  }
  return encodeConverted(out);
}

std::optional<Error> PictureTranscoder::encodeConverted(std::vector<mp4::EncodedSample>& out) {
  const AVRational ticks = {1, static_cast<int>(mp4::kMovieTimescale)};
  while (av_buffersink_get_frame(converted_, frame_.get()) == 0) {
    const int64_t time = av_rescale_q(frame_->pts, av_buffersink_get_time_base(converted_), ticks);
    const int64_t tick = time - range_.start;
    const bool isShown = time < range_.end && tick > lastTick_;
    std::optional<Error> error;
    if (isShown) {
      lastTick_ = tick;
      error = encoder_->encode(*frame_, tick, out);
    }
    av_frame_unref(frame_.get());
    if (error) return error;
  }
  return std::nullopt;
}

}  // namespace qv::platform::ffmpeg
