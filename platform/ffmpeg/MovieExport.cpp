#include "platform/ffmpeg/MovieExport.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>

#include "platform/mp4/MovieFile.h"

namespace qv::platform::ffmpeg {
namespace {

/// How far a range may reach beyond its movie: less than a frame.
constexpr int64_t kRangeTolerance = mp4::kMovieTimescale / 60;

/// Samples of a track that are written in one piece.
constexpr size_t kChunkSamples = 128;

Error notExportable(const std::string& text) { return mp4::movieError(mp4::kMovieNotReadable, text); }

}  // namespace

MovieExport::MovieExport(ExportPlan plan, const std::atomic<bool>& cancelled)
    : plan_(std::move(plan)), cancelled_(cancelled) {}

std::optional<Error> MovieExport::run() {
  // In the same directory, so that the renaming moves nothing; a name of this run's alone.
  static std::atomic<uint64_t> runs{0};
  const std::string path =
      plan_.destination + "." + std::to_string(::getpid()) + "-" + std::to_string(++runs) + ".partial";
  auto error = exportTo(path);
  writer_.reset();
  if (!error && cancelled_.load()) error = mp4::movieError(mp4::kMovieCancelled, "The export was cancelled.");
  if (!error && std::rename(path.c_str(), plan_.destination.c_str()) != 0) {
    error = Error::posix(errno, plan_.destination);
  }
  if (error) (void)::unlink(path.c_str());
  return error;
}

std::optional<Error> MovieExport::exportTo(const std::string& path) {
  auto reader = MovieReader::open(plan_.source, &cancelled_);
  if (!reader) return reader.error();
  reader_ = std::move(*reader);
  if (auto error = chooseRange()) return error;
  if (auto error = planOutputs()) return error;
  if (auto error = openDestination(path)) return error;
  if (auto error = copyMedia()) return error;
  if (auto error = finishMedia()) return error;
  if (auto error = writer_->finish({std::nullopt, static_cast<uint64_t>(range_.end - range_.start)})) return error;
  return writer_->close();
}

std::optional<Error> MovieExport::chooseRange() {
  const int64_t duration = reader_->duration();
  range_ = {0, duration};
  if (!plan_.range.start.isValid() && !plan_.range.duration.isValid()) return std::nullopt;
  if (!plan_.range.start.isNumeric() || !plan_.range.duration.isNumeric()) return notExportable("no such time range");
  const int64_t start = plan_.range.start.valueAt(mp4::kMovieTimescale);
  const int64_t length = plan_.range.duration.valueAt(mp4::kMovieTimescale);
  if (start < 0 || length <= 0 || start >= duration || length > duration - start + kRangeTolerance) {
    return notExportable("the time range is not part of the movie");
  }
  range_ = {start, std::min(duration, start + length)};
  return std::nullopt;
}

std::optional<Error> MovieExport::planVideo(const AVStream& stream) {
  Output output;
  output.streams = {stream.index};
  auto copier = TrackCopier::create(stream, static_cast<uint32_t>(outputs_.size() + 1), range_);
  if (copier) {
    output.copier = std::move(*copier);
  } else {
    if (plan_.preset == ExportPreset::PassThrough) return copier.error();
    auto transcoder = PictureTranscoder::create(stream, range_);
    if (!transcoder) return transcoder.error();
    output.transcoder = std::move(*transcoder);
  }
  outputs_.push_back(std::move(output));
  return std::nullopt;
}

std::optional<Error> MovieExport::planOutputs() {
  for (const AVStream* stream : reader_->streams(AVMEDIA_TYPE_VIDEO)) {
    if (auto error = planVideo(*stream)) return error;
  }
  const auto sounds = reader_->streams(AVMEDIA_TYPE_AUDIO);
  if (plan_.preset == ExportPreset::HighestQuality && !sounds.empty()) {
    auto mixer = AudioMixer::create(sounds, range_);
    if (!mixer) return mixer.error();
    Output output;
    output.mixer = std::move(*mixer);
    for (const AVStream* stream : sounds) output.streams.push_back(stream->index);
    outputs_.push_back(std::move(output));
    return std::nullopt;
  }
  for (const AVStream* stream : sounds) {
    auto copier = TrackCopier::create(*stream, static_cast<uint32_t>(outputs_.size() + 1), range_);
    if (!copier) return copier.error();
    Output output;
    output.copier = std::move(*copier);
    output.streams = {stream->index};
    outputs_.push_back(std::move(output));
  }
  return std::nullopt;
}

mp4::MovieTrack MovieExport::trackOf(const Output& output, uint32_t trackID) const {
  if (output.copier) return output.copier->track();
  return output.mixer ? output.mixer->track(trackID) : output.transcoder->track(trackID);
}

std::optional<Error> MovieExport::openDestination(const std::string& path) {
  auto file = mp4::DiskMovieFile::create(path);
  if (!file) return file.error();
  std::vector<mp4::MovieTrack> tracks;
  for (const Output& output : outputs_) tracks.push_back(trackOf(output, static_cast<uint32_t>(tracks.size() + 1)));
  pending_.resize(outputs_.size());
  writer_ = std::make_unique<mp4::MovieWriter>(std::move(*file), std::move(tracks), mp4::MovieWriter::Layout::Plain);
  return writer_->writeHeader();
}

bool MovieExport::isDone() const {
  return std::all_of(outputs_.begin(), outputs_.end(),
                     [](const Output& output) { return output.copier && output.copier->isDone(); });
}

std::optional<Error> MovieExport::copyMedia() {
  // Sound is mixed from the beginning; a range is cut out of it later. Otherwise a little earlier than the start,
  // for the packet of sound before it.
  const bool isMixed = std::any_of(outputs_.begin(), outputs_.end(), [](const Output& o) { return !o.copier; });
  if (range_.start > 0 && !isMixed) reader_->seek(std::max<int64_t>(0, range_.start - mp4::kMovieTimescale / 5));
  const Packet packet(av_packet_alloc());
  while (!isDone()) {
    if (cancelled_.load()) return mp4::movieError(mp4::kMovieCancelled, "The export was cancelled.");
    const auto got = reader_->read(*packet);
    if (!got) return got.error();
    if (!got.value()) break;
    auto error = handle(*packet);
    av_packet_unref(packet.get());
    if (!error) error = writePending(false);
    if (error) return error;
  }
  return std::nullopt;
}

std::optional<Error> MovieExport::handle(const AVPacket& packet) {
  for (size_t i = 0; i < outputs_.size(); ++i) {
    Output& output = outputs_[i];
    if (std::find(output.streams.begin(), output.streams.end(), packet.stream_index) == output.streams.end()) continue;
    if (output.copier) output.copier->add(packet, pending_[i]);
    if (output.mixer) return output.mixer->add(packet.stream_index, packet, pending_[i]);
    if (output.transcoder) return output.transcoder->add(packet, pending_[i]);
  }
  return std::nullopt;
}

std::optional<Error> MovieExport::finishMedia() {
  for (size_t i = 0; i < outputs_.size(); ++i) {
    Output& output = outputs_[i];
    std::optional<Error> error;
    if (output.copier) output.copier->finish(pending_[i]);
    if (output.mixer) error = output.mixer->finish(pending_[i]);
    if (output.transcoder) error = output.transcoder->finish(pending_[i]);
    if (error) return error;
    if (!output.copier) continue;
    const mp4::MovieTrack& track = output.copier->track();
    if (track.kind == mp4::MovieTrack::Kind::Video && !output.copier->reachedEnd()) {
      return notExportable("the movie is cut short");
    }
    writer_->setTrackStart(i, track.mediaStart, track.startDelay);
  }
  return writePending(true);
}

std::optional<Error> MovieExport::writePending(bool all) {
  const bool isFull = std::any_of(pending_.begin(), pending_.end(),
                                  [](const auto& samples) { return samples.size() >= kChunkSamples; });
  if (!all && !isFull) return std::nullopt;
  auto error = writer_->writeFragment(pending_);
  for (auto& samples : pending_) samples.clear();
  return error;
}

}  // namespace qv::platform::ffmpeg
