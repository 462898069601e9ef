#include "platform/mp4/MovieWriter.h"

#include <algorithm>

#include "platform/mp4/MovieHeader.h"

namespace qv::platform::mp4 {
namespace {

/// value * to / from, rounded to nearest; of a value that is not negative.
int64_t rescale(int64_t value, uint32_t from, uint32_t to) {
  return static_cast<int64_t>((static_cast<__int128>(value) * to + from / 2) / from);
}

}  // namespace

Error movieError(MovieErrorCode code, const std::string& text) {
  return Error{kMovieErrorDomain, code, {{kLocalizedDescriptionKey, Value(text)}}};
}

MovieWriter::MovieWriter(std::unique_ptr<MovieFile> file, std::vector<MovieTrack> tracks, Layout layout)
    : file_(std::move(file)), tracks_(std::move(tracks)), layout_(layout), index_(tracks_.size()) {}

std::optional<Error> MovieWriter::appendBytes(std::span<const uint8_t> bytes) {
  if (auto error = writeFully(*file_, bytes, size_)) {
    // A reader must not meet half a box; where even this fails, a salvage cuts it.
    (void)file_->truncate(size_);
    return error;
  }
  size_ += bytes.size();
  return std::nullopt;
}

std::optional<Error> MovieWriter::syncFile() {
  const int failure = file_->sync();
  if (failure != 0) return Error::posix(failure, "movie file");
  return std::nullopt;
}

std::optional<Error> MovieWriter::writeHeader() {
  ByteWriter out;
  writeFileType(out);
  placeholderOffset_ = out.size();
  writePlaceholder(out);
  if (layout_ == Layout::Fragmented) writeFragmentedHeader(out, tracks_);
  return appendBytes(out.bytes());
}

std::optional<Error> MovieWriter::writeFragment(const std::vector<std::vector<EncodedSample>>& samples) {
  std::vector<FragmentTrack> parts;
  for (size_t i = 0; i < tracks_.size(); ++i) {
    if (!samples[i].empty()) parts.push_back({&tracks_[i], samples[i]});
  }
  if (parts.empty()) return std::nullopt;
  ByteWriter out;
  if (layout_ == Layout::Fragmented) writeFragmentHead(out, ++sequenceNumber_, parts);
  uint64_t offset = size_ + out.size();
  for (const FragmentTrack& part : parts) {
    for (const EncodedSample& sample : part.samples) out.append(sample.data);
  }
  if (auto error = appendBytes(out.bytes())) return error;
  for (const FragmentTrack& part : parts) {
    TrackIndex& index = index_[static_cast<size_t>(part.track - tracks_.data())];
    for (const EncodedSample& sample : part.samples) {
      index.add(sample, offset, &sample == part.samples.data());
      offset += sample.data.size();
    }
  }
  return layout_ == Layout::Fragmented ? syncFile() : std::nullopt;
}

void MovieWriter::setTrackStart(size_t index, int64_t mediaStart, uint64_t startDelay) {
  tracks_[index].mediaStart = mediaStart;
  tracks_[index].startDelay = startDelay;
}

void MovieWriter::adopt(uint64_t placeholderOffset, uint64_t size, std::vector<TrackIndex> index) {
  placeholderOffset_ = placeholderOffset;
  size_ = size;
  index_ = std::move(index);
}

bool MovieWriter::endsWithPictureAt(std::optional<int64_t> time) const {
  for (size_t i = 0; i < tracks_.size(); ++i) {
    if (tracks_[i].kind != MovieTrack::Kind::Video || index_[i].isEmpty()) continue;
    if (index_[i].lastDecodeTime() == time) return true;
  }
  return false;
}

uint64_t MovieWriter::movieDuration(const MovieEnd& end) const {
  if (end.duration) return *end.duration + (endsWithPictureAt(end.lastPicture) ? end.lastPictureShown : 0);
  uint64_t longest = 0;
  for (size_t i = 0; i < tracks_.size(); ++i) {
    if (index_[i].isEmpty()) continue;
    const int64_t length = index_[i].endTime() - tracks_[i].mediaStart;
    const auto ticks = rescale(std::max<int64_t>(length, 0), tracks_[i].timescale, kMovieTimescale);
    const uint64_t duration = tracks_[i].startDelay + static_cast<uint64_t>(ticks);
    // The picture decides, sound without a picture is not shown; a movie of sound alone has its own length.
    if (tracks_[i].kind == MovieTrack::Kind::Video) return duration;
    longest = std::max(longest, duration);
  }
  return longest;
}

std::vector<uint8_t> MovieWriter::buildHeader(const MovieEnd& end) {
  for (size_t i = 0; i < tracks_.size(); ++i) {
    if (end.lastPicture && tracks_[i].kind == MovieTrack::Kind::Video) index_[i].dropFrom(*end.lastPicture + 1);
  }
  const uint64_t duration = movieDuration(end);
  std::vector<IndexedTrack> parts;
  for (size_t i = 0; i < tracks_.size(); ++i) {
    const MovieTrack& track = tracks_[i];
    TrackIndex& index = index_[i];
    if (index.isEmpty() || track.startDelay >= duration) continue;
    const uint64_t shown = duration - track.startDelay;
    const int64_t mediaEnd = track.mediaStart + rescale(static_cast<int64_t>(shown), kMovieTimescale, track.timescale);
    if (track.kind == MovieTrack::Kind::Video) {
      if (mediaEnd > index.lastDecodeTime()) index.setEndTime(mediaEnd);
      parts.push_back({&track, &index, shown});
    } else {
      index.dropFrom(mediaEnd);
      const int64_t length = std::max<int64_t>(0, index.endTime() - track.mediaStart);
      const auto available = static_cast<uint64_t>(rescale(length, track.timescale, kMovieTimescale));
      if (available > 0) parts.push_back({&track, &index, std::min(shown, available)});
    }
  }
  ByteWriter out;
  if (!parts.empty()) writeMovieHeader(out, parts);
  return out.take();
}

std::optional<Error> MovieWriter::finish(const MovieEnd& end) {
  const std::vector<uint8_t> header = buildHeader(end);
  if (header.empty()) return movieError(kMovieWithoutMedia, "The movie has no media.");
  const uint64_t mediaEnd = size_;
  if (auto error = appendBytes(header)) return error;
  if (auto error = syncFile()) return error;
  ByteWriter head;
  writeMediaDataHead(head, mediaEnd - placeholderOffset_);
  if (auto error = writeFully(*file_, head.bytes(), placeholderOffset_)) return error;
  return syncFile();
}

std::optional<Error> MovieWriter::close() {
  const int failure = file_->close();
  if (failure != 0) return Error::posix(failure, "movie file");
  return std::nullopt;
}

}  // namespace qv::platform::mp4
