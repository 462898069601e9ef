#include "platform/mp4/MovieHeader.h"

#include <algorithm>
#include <limits>

namespace qv::platform::mp4 {
namespace {

constexpr uint16_t kUndeterminedLanguage = 0x55C4;
constexpr uint32_t kTrackEnabledInMovie = 3;
constexpr uint32_t kSyncSampleFlags = 0x02000000;
constexpr uint32_t kDependentSampleFlags = 0x01010000;

void writeMatrix(ByteWriter& out, const DisplayMatrix& matrix) {
  for (const int32_t value : matrix) out.u32(static_cast<uint32_t>(value));
}

void writeMovieHead(ByteWriter& out, uint64_t duration, uint32_t nextTrackID) {
  BoxScope box(out, "mvhd", 1, 0);
  out.zeros(16);  // creation and modification time: unknown
  out.u32(kMovieTimescale);
  out.u64(duration);
  out.u32(0x00010000);  // rate
  out.u16(0x0100);      // volume
  out.zeros(10);
  writeMatrix(out, kIdentityMatrix);
  out.zeros(24);
  out.u32(nextTrackID);
}

void writeTrackHead(ByteWriter& out, const MovieTrack& track, uint64_t duration) {
  BoxScope box(out, "tkhd", 1, kTrackEnabledInMovie);
  out.zeros(16);
  out.u32(track.trackID);
  out.u32(0);
  out.u64(duration);
  out.zeros(8);
  out.u16(0);
  out.u16(0);
  out.u16(track.kind == MovieTrack::Kind::Audio ? 0x0100 : 0);
  out.u16(0);
  writeMatrix(out, track.matrix);
  out.u32(uint64_t{track.width} << 16);
  out.u32(uint64_t{track.height} << 16);
}

void writeEditList(ByteWriter& out, const MovieTrack& track, uint64_t duration) {
  BoxScope edits(out, "edts");
  BoxScope box(out, "elst", 1, 0);
  out.u32(track.startDelay > 0 ? 2 : 1);
  if (track.startDelay > 0) {
    out.u64(track.startDelay);
    out.u64(std::numeric_limits<uint64_t>::max());  // media time -1: nothing is shown
    out.u32(0x00010000);
  }
  out.u64(duration);
  out.u64(static_cast<uint64_t>(track.mediaStart));
  out.u32(0x00010000);
}

void writeHandler(ByteWriter& out, MovieTrack::Kind kind) {
  BoxScope box(out, "hdlr", 0, 0);
  out.u32(0);
  kind == MovieTrack::Kind::Video ? out.code("vide") : out.code("soun");
  out.zeros(12);
  out.u8(0);  // an empty name
}

void writeMediaInformationHead(ByteWriter& out, MovieTrack::Kind kind) {
  if (kind == MovieTrack::Kind::Video) {
    BoxScope box(out, "vmhd", 0, 1);
    out.zeros(8);
  } else {
    BoxScope box(out, "smhd", 0, 0);
    out.zeros(4);
  }
  BoxScope information(out, "dinf");
  BoxScope references(out, "dref", 0, 0);
  out.u32(1);
  BoxScope self(out, "url ", 0, 1);
}

void writeEmptyTables(ByteWriter& out) {
  for (const auto& code : {"stts", "stsc", "stco"}) {
    const char name[5] = {code[0], code[1], code[2], code[3], 0};
    BoxScope box(out, name, 0, 0);
    out.u32(0);
  }
  BoxScope box(out, "stsz", 0, 0);
  out.zeros(8);
}

/// `index` is null in the header of a file of fragments.
void writeTrack(ByteWriter& out, const MovieTrack& track, const TrackIndex* index, uint64_t duration) {
  BoxScope trak(out, "trak");
  writeTrackHead(out, track, track.startDelay + duration);
  writeEditList(out, track, duration);
  BoxScope mdia(out, "mdia");
  {
    BoxScope box(out, "mdhd", 1, 0);
    out.zeros(16);
    out.u32(track.timescale);
    out.u64(index ? static_cast<uint64_t>(index->endTime() - index->firstDecodeTime()) : 0);
    out.u16(kUndeterminedLanguage);
    out.u16(0);
  }
  writeHandler(out, track.kind);
  BoxScope minf(out, "minf");
  writeMediaInformationHead(out, track.kind);
  BoxScope stbl(out, "stbl");
  {
    BoxScope box(out, "stsd", 0, 0);
    out.u32(1);
    out.append(track.sampleEntry);
  }
  index ? index->writeTables(out) : writeEmptyTables(out);
}

constexpr uint32_t kDefaultBaseIsMoof = 0x020000;
constexpr uint32_t kDefaultDurationPresent = 0x000008;
constexpr uint32_t kDefaultFlagsPresent = 0x000020;
constexpr uint32_t kDataOffsetPresent = 0x000001;
constexpr uint32_t kFirstSampleFlagsPresent = 0x000004;
constexpr uint32_t kSampleDurationPresent = 0x000100;
constexpr uint32_t kSampleSizePresent = 0x000200;

std::vector<uint32_t> durationsOf(std::span<const EncodedSample> samples) {
  std::vector<uint32_t> durations;
  for (size_t i = 0; i + 1 < samples.size(); ++i) {
    durations.push_back(static_cast<uint32_t>(samples[i + 1].decodeTime - samples[i].decodeTime));
  }
  durations.push_back(samples.back().duration);
  return durations;
}

/// How many samples, from `from` on, one run can hold: all depend on others, but maybe the first.
size_t runLength(std::span<const EncodedSample> samples, size_t from, bool allSync) {
  if (allSync) return samples.size() - from;
  size_t end = from + 1;
  while (end < samples.size() && !samples[end].isSync) ++end;
  return end - from;
}

/// A run's place for where its data is, to be filled in when the fragment's head is complete.
struct RunOffset {
  size_t position;
  uint64_t dataSize;
};

/// Writes one track's part, with no more said of each sample than differs: that is most of what fragments cost.
void writeFragmentRuns(ByteWriter& out, const FragmentTrack& part, std::vector<RunOffset>& runs) {
  const auto durations = durationsOf(part.samples);
  const bool isRegular = std::all_of(durations.begin(), durations.end(), [&](auto d) { return d == durations[0]; });
  const bool allSync = std::all_of(part.samples.begin(), part.samples.end(), [](const auto& s) { return s.isSync; });
  BoxScope traf(out, "traf");
  {
    BoxScope box(out, "tfhd", 0, kDefaultBaseIsMoof | kDefaultFlagsPresent | (isRegular ? kDefaultDurationPresent : 0));
    out.u32(part.track->trackID);
    if (isRegular) out.u32(durations[0]);
    out.u32(allSync ? kSyncSampleFlags : kDependentSampleFlags);
  }
  {
    BoxScope box(out, "tfdt", 1, 0);
    out.u64(static_cast<uint64_t>(part.samples.front().decodeTime));
  }
  for (size_t from = 0, length = 0; from < part.samples.size(); from += length) {
    length = runLength(part.samples, from, allSync);
    const bool marksFirst = !allSync && part.samples[from].isSync;
    BoxScope box(out, "trun", 0,
                 kDataOffsetPresent | kSampleSizePresent | (marksFirst ? kFirstSampleFlagsPresent : 0) |
                     (isRegular ? 0 : kSampleDurationPresent));
    out.u32(length);
    RunOffset run{out.size(), 0};
    out.u32(0);
    if (marksFirst) out.u32(kSyncSampleFlags);
    for (size_t i = from; i < from + length; ++i) {
      if (!isRegular) out.u32(durations[i]);
      out.u32(part.samples[i].data.size());
      run.dataSize += part.samples[i].data.size();
    }
    runs.push_back(run);
  }
}

}  // namespace

void writeFileType(ByteWriter& out) {
  BoxScope box(out, "ftyp");
  out.code("isom");
  out.u32(0x200);
  for (const auto& brand : {"isom", "iso2", "iso6", "avc1", "mp41", "mp42"}) {
    out.append({reinterpret_cast<const uint8_t*>(brand), 4});
  }
}

void writePlaceholder(ByteWriter& out) {
  BoxScope box(out, "free");
  out.zeros(kPlaceholderSize - 8);
}

void writeMediaDataHead(ByteWriter& out, uint64_t size) {
  out.u32(1);  // the size follows, in 64 bits
  out.code("mdat");
  out.u64(size);
}

void writeFragmentedHeader(ByteWriter& out, std::span<const MovieTrack> tracks) {
  BoxScope moov(out, "moov");
  uint32_t lastID = 0;
  for (const MovieTrack& track : tracks) lastID = std::max(lastID, track.trackID);
  writeMovieHead(out, 0, lastID + 1);
  for (const MovieTrack& track : tracks) writeTrack(out, track, nullptr, 0);
  BoxScope mvex(out, "mvex");
  for (const MovieTrack& track : tracks) {
    BoxScope box(out, "trex", 0, 0);
    out.u32(track.trackID);
    out.u32(1);
    out.zeros(12);
  }
}

void writeMovieHeader(ByteWriter& out, std::span<const IndexedTrack> tracks) {
  BoxScope moov(out, "moov");
  uint64_t duration = 0;
  uint32_t lastID = 0;
  for (const IndexedTrack& part : tracks) {
    duration = std::max(duration, part.track->startDelay + part.duration);
    lastID = std::max(lastID, part.track->trackID);
  }
  writeMovieHead(out, duration, lastID + 1);
  for (const IndexedTrack& part : tracks) writeTrack(out, *part.track, part.index, part.duration);
}

void writeFragmentHead(ByteWriter& out, uint32_t sequenceNumber, std::span<const FragmentTrack> tracks) {
  const size_t start = out.size();
  std::vector<RunOffset> runs;
  {
    BoxScope moof(out, "moof");
    {
      BoxScope box(out, "mfhd", 0, 0);
      out.u32(sequenceNumber);
    }
    for (const FragmentTrack& part : tracks) writeFragmentRuns(out, part, runs);
  }
  const size_t headEnd = out.size() + 8;
  uint64_t offset = headEnd - start;
  for (const RunOffset& run : runs) {
    out.patch32(run.position, offset);
    offset += run.dataSize;
  }
  out.u32(offset - (headEnd - 8 - start));
  out.code("mdat");
}

}  // namespace qv::platform::mp4
