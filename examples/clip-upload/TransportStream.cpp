#include "TransportStream.h"

#include <algorithm>
#include <cstring>

#include "MovieInput.h"

namespace upload {

namespace {

constexpr AVRational kMicroseconds{1, 1'000'000};
/// The stream's first time; the lead-in of sound may lie before a clip's start.
constexpr int64_t kStreamStart = 1'000'000;

bool isSame(const AVCodecParameters& a, const AVCodecParameters& b) {
  return a.codec_id == b.codec_id && a.width == b.width && a.height == b.height && a.sample_rate == b.sample_rate &&
         a.extradata_size == b.extradata_size &&
         std::memcmp(a.extradata, b.extradata, static_cast<size_t>(a.extradata_size)) == 0;
}

}  // namespace

TransportStream::~TransportStream() { close(); }

void TransportStream::close() {
  avformat_free_context(stream_);
  stream_ = nullptr;
}

std::optional<TransportStream::Segment> TransportStream::append(int file, std::string& error) {
  int result = 0;
  const auto input = MovieInput::open(file, result);
  if (!input) {
    error = errorText(result);
    return std::nullopt;
  }
  AVFormatContext& movie = input->context();
  std::vector<Track> tracks;
  for (const AVMediaType kind : {AVMEDIA_TYPE_VIDEO, AVMEDIA_TYPE_AUDIO}) {
    const int track = av_find_best_stream(&movie, kind, -1, -1, nullptr, 0);
    if (track >= 0) tracks.push_back({track, static_cast<int>(tracks.size())});
  }
  Segment segment;
  segment.isDiscontinuous = hasGap_ || (stream_ != nullptr && !fits(movie, tracks));
  if ((stream_ == nullptr || segment.isDiscontinuous) && !begin(movie, tracks)) {
    error = "its streams fit no transport stream";
    return std::nullopt;
  }
  hasGap_ = false;
  // Each segment begins with the tables of the stream.
  av_opt_set(stream_->priv_data, "mpegts_flags", "resend_headers", 0);
  if (avio_open_dyn_buf(&stream_->pb) < 0) return std::nullopt;
  int64_t end = 0;
  result = copyPackets(movie, tracks, end);
  uint8_t* bytes = nullptr;
  const int size = avio_close_dyn_buf(stream_->pb, &bytes);
  stream_->pb = nullptr;
  if (result >= 0) segment.bytes.assign(bytes, bytes + size);
  av_free(bytes);
  base_ += end;
  segment.duration = static_cast<double>(end) / 1e6;
  if (result >= 0) return segment;
  error = errorText(result);
  return std::nullopt;
}

bool TransportStream::fits(const AVFormatContext& movie, const std::vector<Track>& tracks) const {
  if (tracks.size() != stream_->nb_streams) return false;
  return std::all_of(tracks.begin(), tracks.end(), [&](const Track& track) {
    return isSame(*movie.streams[track.input]->codecpar, *stream_->streams[track.output]->codecpar);
  });
}

bool TransportStream::begin(const AVFormatContext& movie, std::vector<Track>& tracks) {
  close();
  avformat_alloc_output_context2(&stream_, nullptr, "mpegts", nullptr);
  if (stream_ == nullptr || tracks.empty()) return false;
  stream_->avoid_negative_ts = 0;
  for (const Track& track : tracks) {
    AVStream* stream = avformat_new_stream(stream_, nullptr);
    if (stream == nullptr || avcodec_parameters_copy(stream->codecpar, movie.streams[track.input]->codecpar) < 0)
      return false;
    stream->codecpar->codec_tag = 0;
  }
  if (base_ == 0) base_ = kStreamStart;
  lastTimes_.assign(tracks.size(), INT64_MIN);
  AVIOContext* io = nullptr;
  if (avio_open_dyn_buf(&io) < 0) return false;
  stream_->pb = io;
  const int result = avformat_write_header(stream_, nullptr);
  uint8_t* header = nullptr;
  avio_close_dyn_buf(io, &header);
  av_free(header);
  stream_->pb = nullptr;
  return result >= 0;
}

/// `end`: how long the pictures last, in microseconds; of a movie without pictures, the sound.
int TransportStream::copyPackets(AVFormatContext& movie, const std::vector<Track>& tracks, int64_t& end) {
  const Packet packet(av_packet_alloc());
  int result = 0;
  while ((result = av_read_frame(&movie, packet.get())) >= 0) {
    const auto track = std::find_if(tracks.begin(), tracks.end(),
                                    [&](const Track& each) { return each.input == packet->stream_index; });
    if (track == tracks.end() || packet->dts == AV_NOPTS_VALUE) {
      av_packet_unref(packet.get());
      continue;
    }
    av_packet_rescale_ts(packet.get(), movie.streams[track->input]->time_base, kMicroseconds);
    const int64_t packetEnd = packet->pts + packet->duration;
    if (track->output == 0) end = std::max(end, packetEnd);
    int64_t& last = lastTimes_[static_cast<size_t>(track->output)];
    // The sound encoder's lead-in, and sound that the clip before already had.
    if (packetEnd <= 0 || packet->dts + base_ <= last) {
      av_packet_unref(packet.get());
      continue;
    }
    packet->pts += base_;
    packet->dts += base_;
    last = packet->dts;
    packet->stream_index = track->output;
    packet->pos = -1;
    av_packet_rescale_ts(packet.get(), kMicroseconds, stream_->streams[track->output]->time_base);
    if ((result = av_interleaved_write_frame(stream_, packet.get())) < 0) return result;
  }
  if (result != AVERROR_EOF) return result;
  if ((result = av_interleaved_write_frame(stream_, nullptr)) < 0) return result;
  return av_write_frame(stream_, nullptr);
}

}  // namespace upload
