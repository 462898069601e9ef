#include "platform/ffmpeg/TrackCopier.h"

#include <algorithm>

#include "platform/mp4/AnnexB.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {
namespace {

/// A track may end a little before its movie does.
constexpr int64_t kEndToleranceSeconds = 1;

std::span<const uint8_t> extradata(const AVCodecParameters& parameters) {
  return {parameters.extradata, static_cast<size_t>(parameters.extradata_size)};
}

mp4::ColorDescription colorOf(const AVCodecParameters& parameters) {
  return {static_cast<uint16_t>(parameters.color_primaries), static_cast<uint16_t>(parameters.color_trc),
          static_cast<uint16_t>(parameters.color_space), parameters.color_range == AVCOL_RANGE_JPEG};
}

void describeVideo(const AVStream& stream, bool isByteStream, mp4::MovieTrack& track) {
  const AVCodecParameters& parameters = *stream.codecpar;
  track.kind = mp4::MovieTrack::Kind::Video;
  track.width = static_cast<uint32_t>(parameters.width);
  track.height = static_cast<uint32_t>(parameters.height);
  size_t size = 0;
  const uint8_t* matrix = av_stream_get_side_data(&stream, AV_PKT_DATA_DISPLAYMATRIX, &size);
  if (matrix && size >= sizeof track.matrix)
    std::copy_n(reinterpret_cast<const int32_t*>(matrix), 9, track.matrix.begin());
  const auto extra = extradata(parameters);
  const auto configuration =
      isByteStream ? mp4::makeAVCConfiguration(extra) : std::vector<uint8_t>(extra.begin(), extra.end());
  if (configuration.empty()) return;
  track.sampleEntry = mp4::makeAVCSampleEntry(track.width, track.height, configuration, colorOf(parameters));
}

void describeAudio(const AVStream& stream, mp4::MovieTrack& track) {
  const AVCodecParameters& parameters = *stream.codecpar;
  track.kind = mp4::MovieTrack::Kind::Audio;
  if (parameters.extradata_size <= 0 || parameters.extradata_size > 100) return;
  track.sampleEntry = mp4::makeAACSampleEntry(static_cast<uint32_t>(parameters.sample_rate),
                                              static_cast<uint32_t>(parameters.ch_layout.nb_channels),
                                              static_cast<uint32_t>(parameters.bit_rate), extradata(parameters));
}

}  // namespace

Result<TrackCopier> TrackCopier::create(const AVStream& stream, uint32_t trackID, const ExportRange& range) {
  TrackCopier copier;
  const AVCodecParameters& parameters = *stream.codecpar;
  copier.track_.trackID = trackID;
  copier.track_.timescale = static_cast<uint32_t>(stream.time_base.den);
  if (parameters.codec_id == AV_CODEC_ID_H264) {
    copier.isByteStream_ = parameters.extradata_size > 0 && parameters.extradata[0] != 1;
    describeVideo(stream, copier.isByteStream_, copier.track_);
  } else if (parameters.codec_id == AV_CODEC_ID_AAC) {
    describeAudio(stream, copier.track_);
  }
  if (copier.track_.sampleEntry.empty() || stream.time_base.num != 1) {
    return mp4::movieError(mp4::kMovieNotReadable, "track " + std::to_string(trackID) + " cannot be copied");
  }
  const AVRational ticks = {1, static_cast<int>(mp4::kMovieTimescale)};
  copier.start_ = av_rescale_q(range.start, ticks, stream.time_base);
  copier.end_ = av_rescale_q(range.end, ticks, stream.time_base);
  return copier;
}

mp4::EncodedSample TrackCopier::makeSample(const AVPacket& packet) const {
  const std::span<const uint8_t> bytes(packet.data, static_cast<size_t>(packet.size));
  mp4::EncodedSample sample;
  sample.data = isByteStream_ ? mp4::lengthPrefixed(bytes) : std::vector<uint8_t>(bytes.begin(), bytes.end());
  sample.decodeTime = packet.dts;
  sample.compositionOffset = static_cast<int32_t>(packet.pts - packet.dts);
  sample.duration = static_cast<uint32_t>(std::max<int64_t>(1, packet.duration));
  sample.isSync = (packet.flags & AV_PKT_FLAG_KEY) != 0;
  return sample;
}

void TrackCopier::add(const AVPacket& packet, std::vector<mp4::EncodedSample>& out) {
  if (done_ || packet.pts == AV_NOPTS_VALUE || packet.dts == AV_NOPTS_VALUE) return;
  if (packet.dts >= end_) {
    if (!begun_) begin(out);
    done_ = true;
    lastEnd_ = end_;
    return;
  }
  lastEnd_ = std::max(lastEnd_, packet.pts + packet.duration);
  mp4::EncodedSample sample = makeSample(packet);
  if (begun_) {
    sample.decodeTime -= base_;
    out.push_back(std::move(sample));
    return;
  }
  if (track_.kind == mp4::MovieTrack::Kind::Video) {
    // A key frame before the start makes all before it superfluous.
    if (sample.isSync && packet.pts <= start_) held_.clear();
    if (!sample.isSync && held_.empty()) return;
  } else {
    // The decoder needs the packet before the one in which the range begins.
    while (held_.size() > 1 && held_[1].presentationTime + held_[1].sample.duration <= start_) held_.pop_front();
  }
  held_.push_back({std::move(sample), packet.pts});
  if (packet.dts > start_) begin(out);
}

void TrackCopier::begin(std::vector<mp4::EncodedSample>& out) {
  begun_ = true;
  if (held_.empty()) return;
  if (track_.kind == mp4::MovieTrack::Kind::Video) alignWithStart();
  base_ = held_.front().sample.decodeTime;
  int64_t first = held_.front().presentationTime;
  for (const Held& held : held_) first = std::min(first, held.presentationTime);
  track_.mediaStart = std::max(start_, first) - base_;
  if (first > start_) {
    track_.startDelay = static_cast<uint64_t>(av_rescale(first - start_, mp4::kMovieTimescale, track_.timescale));
  }
  for (Held& held : held_) {
    held.sample.decodeTime -= base_;
    out.push_back(std::move(held.sample));
  }
  held_.clear();
}

/// The picture that is shown at the start begins there and not before. Readers differ about a picture that an edit list
/// cuts in two: some leave it out and show the next one in its place, too early, which on a still screen is half a
/// second. Reordered pictures stay as they are.
void TrackCopier::alignWithStart() {
  const bool isReordered = std::any_of(held_.begin(), held_.end(), [this](const Held& held) {
    return held.sample.compositionOffset != held_.front().sample.compositionOffset;
  });
  const auto after =
      std::find_if(held_.begin(), held_.end(), [this](const Held& held) { return held.presentationTime > start_; });
  if (isReordered || after == held_.begin()) return;
  Held& shown = *std::prev(after);
  shown.sample.decodeTime += start_ - shown.presentationTime;
  shown.presentationTime = start_;
}

void TrackCopier::finish(std::vector<mp4::EncodedSample>& out) {
  if (!begun_) begin(out);
  done_ = true;
}

bool TrackCopier::reachedEnd() const {
  return lastEnd_ + kEndToleranceSeconds * static_cast<int64_t>(track_.timescale) >= end_;
}

}  // namespace qv::platform::ffmpeg
