#include "platform/mp4/MovieRemains.h"

#include <algorithm>
#include <string>

#include "platform/mp4/MovieHeader.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::mp4 {
namespace {

constexpr uint32_t kMaximumTrackID = 16;
constexpr int64_t kMaximumTime = int64_t{1} << 52;

Error notOurs(const char* what) { return movieError(kMovieNotReadable, what); }

std::span<const uint8_t> descend(std::span<const uint8_t> bytes, std::initializer_list<uint32_t> path) {
  for (const uint32_t type : path) bytes = findBox(bytes, type);
  return bytes;
}

void readTrackHead(std::span<const uint8_t> content, MovieTrack& track) {
  ByteReader in(content);
  in.skip(4 + 16);
  track.trackID = in.u32();
  in.skip(4 + 8 + 8 + 8);
  for (int32_t& value : track.matrix) value = static_cast<int32_t>(in.u32());
  track.width = in.u32() >> 16;
  track.height = in.u32() >> 16;
  if (in.failed()) track.trackID = 0;
}

int64_t readMediaStart(std::span<const uint8_t> content) {
  ByteReader in(content);
  in.skip(8 + 8);
  return static_cast<int64_t>(in.u64());
}

/// The first sample entry, where it lies whole in its box.
std::vector<uint8_t> readSampleEntry(std::span<const uint8_t> content) {
  if (content.size() < 8) return {};
  auto entries = content.subspan(8);
  const auto entry = takeBox(entries);
  return entry ? std::vector<uint8_t>(entry->whole.begin(), entry->whole.end()) : std::vector<uint8_t>();
}

std::optional<MovieTrack> readTrack(std::span<const uint8_t> trak) {
  MovieTrack track;
  readTrackHead(findBox(trak, boxType("tkhd")), track);
  ByteReader mdhd(descend(trak, {boxType("mdia"), boxType("mdhd")}));
  mdhd.skip(4 + 16);
  track.timescale = mdhd.u32();
  ByteReader hdlr(descend(trak, {boxType("mdia"), boxType("hdlr")}));
  hdlr.skip(8);
  track.kind = hdlr.u32() == boxType("vide") ? MovieTrack::Kind::Video : MovieTrack::Kind::Audio;
  track.mediaStart = readMediaStart(descend(trak, {boxType("edts"), boxType("elst")}));
  track.sampleEntry =
      readSampleEntry(descend(trak, {boxType("mdia"), boxType("minf"), boxType("stbl"), boxType("stsd")}));
  const bool isGood = track.trackID >= 1 && track.trackID <= kMaximumTrackID && track.timescale > 0 &&
                      track.mediaStart >= 0 && track.mediaStart < kMaximumTime && !track.sampleEntry.empty();
  return isGood ? std::optional(track) : std::nullopt;
}

std::vector<MovieTrack> readTracks(std::span<const uint8_t> moov) {
  std::vector<MovieTrack> tracks;
  while (auto box = takeBox(moov)) {
    if (box->type != boxType("trak")) continue;
    auto track = readTrack(box->content);
    if (!track || tracks.size() >= kMaximumTrackID) return {};
    tracks.push_back(std::move(*track));
  }
  return tracks;
}

/// The samples of one track as a fragment's head describes them.
struct SampleRun {
  size_t track;
  int64_t decodeTime;
  uint64_t dataOffset;  ///< from the fragment's beginning
  uint64_t dataSize;
  struct Entry {
    uint32_t duration, size, flags;
  };
  std::vector<Entry> entries;
};

constexpr uint32_t kNotSyncFlag = 0x00010000;
// What tfhd and trun may tell of their samples; where they tell nothing, or more, they are not ours.
constexpr uint32_t kBaseIsMoof = 0x020000, kDefaultDuration = 0x08, kDefaultFlags = 0x20;
constexpr uint32_t kDataOffset = 0x001, kFirstFlags = 0x004, kEachDuration = 0x100, kEachSize = 0x200;

/// What a fragment says of all samples of a track.
struct FragmentDefaults {
  std::optional<uint32_t> duration;
  uint32_t flags;
};

/// Adds the samples of one "trun". False where it is not one of ours.
bool readRun(ByteReader trun, const FragmentDefaults& defaults, SampleRun& run) {
  const uint32_t flags = trun.u32();
  const uint32_t count = trun.u32();
  const uint32_t durationFlag = defaults.duration ? 0 : kEachDuration;
  const uint32_t dataOffset = trun.u32();
  const uint32_t firstFlags = (flags & kFirstFlags) != 0 ? trun.u32() : defaults.flags;
  const size_t entrySize = defaults.duration ? 4 : 8;
  const bool isGood = (flags & ~kFirstFlags) == (kDataOffset | kEachSize | durationFlag) &&
                      dataOffset == run.dataOffset + run.dataSize && !trun.failed() && count > 0 &&
                      trun.left() == count * entrySize;
  if (!isGood) return false;
  for (uint32_t i = 0; i < count; ++i) {
    const uint32_t duration = defaults.duration ? *defaults.duration : trun.u32();
    const uint32_t size = trun.u32();
    if (duration == 0) return false;
    run.entries.push_back({duration, size, i == 0 ? firstFlags : defaults.flags});
    run.dataSize += size;
  }
  return true;
}

/// One track's part of a fragment; nothing where its data is not at `dataOffset`.
std::optional<SampleRun> readRuns(std::span<const uint8_t> traf, uint64_t dataOffset,
                                  const std::vector<MovieTrack>& tracks) {
  ByteReader tfhd(findBox(traf, boxType("tfhd")));
  const uint32_t flags = tfhd.u32();
  const uint32_t trackID = tfhd.u32();
  const auto duration = (flags & kDefaultDuration) != 0 ? std::optional(tfhd.u32()) : std::nullopt;
  const FragmentDefaults defaults{duration, tfhd.u32()};
  ByteReader tfdt(findBox(traf, boxType("tfdt")));
  tfdt.skip(4);
  const auto decodeTime = static_cast<int64_t>(tfdt.u64());
  const auto track =
      std::find_if(tracks.begin(), tracks.end(), [&](const MovieTrack& t) { return t.trackID == trackID; });
  const bool isGood = track != tracks.end() && (flags & ~kDefaultDuration) == (kBaseIsMoof | kDefaultFlags) &&
                      decodeTime >= 0 && decodeTime < kMaximumTime && !tfhd.failed() && !tfdt.failed();
  if (!isGood) return std::nullopt;
  SampleRun run{static_cast<size_t>(track - tracks.begin()), decodeTime, dataOffset, 0, {}};
  while (auto box = takeBox(traf)) {
    if (box->type == boxType("trun") && !readRun(ByteReader(box->content), defaults, run)) return std::nullopt;
  }
  return run.entries.empty() ? std::nullopt : std::optional(std::move(run));
}

/// Reads a fragment's head; nothing where it is not one of ours or does not fit its media data.
std::optional<std::vector<SampleRun>> readFragment(std::span<const uint8_t> moof, const FileBox& head,
                                                   const FileBox& data, const std::vector<MovieTrack>& tracks) {
  std::vector<SampleRun> runs;
  uint64_t expected = head.size + data.headSize;
  while (auto box = takeBox(moof)) {
    if (box->type != boxType("traf")) continue;
    auto run = readRuns(box->content, expected, tracks);
    if (!run) return std::nullopt;
    expected += run->dataSize;
    runs.push_back(std::move(*run));
  }
  if (runs.empty() || expected != head.size + data.size) return std::nullopt;
  return runs;
}

void index(const SampleRun& run, uint64_t fragmentOffset, TrackIndex& index) {
  uint64_t offset = fragmentOffset + run.dataOffset;
  int64_t time = run.decodeTime;
  bool isFirst = true;
  for (const auto& entry : run.entries) {
    index.add(time, entry.duration, entry.size, (entry.flags & kNotSyncFlag) == 0, offset, isFirst);
    isFirst = false;
    time += entry.duration;
    offset += entry.size;
  }
}

void walkFragments(const FileBoxes& boxes, MovieRemains& remains) {
  for (;;) {
    const auto head = boxes.at(remains.end);
    if (!head || head->type != boxType("moof")) return;
    const auto data = boxes.at(head->end());
    if (!data || data->type != boxType("mdat")) return;
    const auto bytes = boxes.read(*head);
    if (bytes.empty()) return;
    const auto runs = readFragment(std::span(bytes).subspan(8), *head, *data, remains.tracks);
    if (!runs) return;
    for (const SampleRun& run : *runs) {
      // Times rise across fragments, or the index could not hold them.
      const TrackIndex& track = remains.index[run.track];
      const bool rises = track.isEmpty() || (run.decodeTime > track.lastDecodeTime() &&
                                             run.decodeTime - track.lastDecodeTime() <= int64_t{UINT32_MAX});
      if (!rises) return;
    }
    for (const SampleRun& run : *runs) index(run, head->offset, remains.index[run.track]);
    remains.end = data->end();
  }
}

/// The boxes that every file of the movie writer's begins with.
struct Beginning {
  FileBox second;
  std::optional<FileBox> third;
};

Result<Beginning> readBeginning(const FileBoxes& boxes) {
  const auto type = boxes.at(0);
  if (!type || type->type != boxType("ftyp")) return notOurs("no file type");
  const auto second = boxes.at(type->end());
  if (!second) return notOurs("no header");
  return Beginning{*second, boxes.at(second->end())};
}

bool isHeader(const std::optional<FileBox>& box) { return box && box->type == boxType("moov"); }

}  // namespace

bool MovieRemains::hasPicture() const {
  for (size_t i = 0; i < tracks.size(); ++i) {
    if (tracks[i].kind == MovieTrack::Kind::Video && !index[i].isEmpty()) return true;
  }
  return false;
}

Result<bool> isFinishedMovie(const FileBoxes& boxes) {
  const auto beginning = readBeginning(boxes);
  if (!beginning) return beginning.error();
  const auto& [second, third] = beginning.value();
  if (second.type == boxType("free") && second.size == kPlaceholderSize && isHeader(third)) return false;
  if (second.type != boxType("mdat") || second.headSize != kPlaceholderSize) return notOurs("no header");
  if (!isHeader(third)) return notOurs("its index is missing");
  return true;
}

Result<MovieRemains> readRemains(const FileBoxes& boxes) {
  const auto beginning = readBeginning(boxes);
  if (!beginning || !isHeader(beginning.value().third)) return notOurs("no header");
  const FileBox& header = *beginning.value().third;
  MovieRemains remains;
  remains.placeholder = beginning.value().second.offset;
  remains.end = header.end();
  const auto bytes = boxes.read(header);
  if (bytes.size() > 8) remains.tracks = readTracks(std::span(bytes).subspan(8));
  if (remains.tracks.empty()) return notOurs("no tracks");
  remains.index.resize(remains.tracks.size());
  walkFragments(boxes, remains);
  return remains;
}

}  // namespace qv::platform::mp4
