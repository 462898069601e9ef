#include "platform/mp4/FragmentReader.h"

#include <algorithm>
#include <span>

#include "platform/mp4/BoxReader.h"
#include "platform/mp4/HeaderReader.h"

namespace qv::platform::mp4 {
namespace {

constexpr uint32_t kNotSyncFlag = 0x00010000;
// What tfhd and trun may tell of their samples; where they tell nothing, or more, they are not ours.
constexpr uint32_t kBaseIsMoof = 0x020000, kDefaultDuration = 0x08, kDefaultFlags = 0x20;
constexpr uint32_t kDataOffset = 0x001, kFirstFlags = 0x004, kEachDuration = 0x100, kEachSize = 0x200;
constexpr uint64_t kMediaHeadSize = 8;
/// Behind the beginning of a fragment, its media begins before this.
constexpr uint64_t kMaximumHeadSize = 1u << 20;

/// What a fragment says of all samples of a track.
struct FragmentDefaults {
  std::optional<uint32_t> duration;
  uint32_t flags = 0;
};

/// Adds the samples of one "trun". False where it is not one of ours.
bool readRun(ByteReader trun, const FragmentDefaults& defaults, SampleRun& run) {
  const uint32_t flags = trun.u32();
  const uint32_t count = trun.u32();
  const uint32_t durationFlag = defaults.duration ? 0 : kEachDuration;
  if ((flags & ~kFirstFlags) != (kDataOffset | kEachSize | durationFlag)) return false;
  const uint32_t dataOffset = trun.u32();
  if (run.entries.empty()) run.offset = dataOffset;
  if (dataOffset != run.end()) return false;
  const uint32_t firstFlags = (flags & kFirstFlags) != 0 ? trun.u32() : defaults.flags;
  const size_t entrySize = defaults.duration ? 4 : 8;
  if (trun.failed() || count == 0 || trun.left() != count * entrySize) return false;
  for (uint32_t i = 0; i < count; ++i) {
    const uint32_t duration = defaults.duration ? *defaults.duration : trun.u32();
    const uint32_t size = trun.u32();
    if (duration == 0) return false;
    run.entries.push_back({duration, size, ((i == 0 ? firstFlags : defaults.flags) & kNotSyncFlag) == 0});
    run.size += size;
  }
  return true;
}

/// One track's part of a fragment; its offset counts from the fragment's beginning. With a damaged "trun", the samples
/// of those before it.
struct TrackPart {
  SampleRun run;
  bool isWhole = true;
};
std::optional<TrackPart> readPart(std::span<const uint8_t> traf, const std::vector<MovieTrack>& tracks) {
  ByteReader tfhd(findBox(traf, boxType("tfhd")));
  const uint32_t flags = tfhd.u32();
  const uint32_t trackID = tfhd.u32();
  FragmentDefaults defaults;
  if ((flags & kDefaultDuration) != 0) defaults.duration = tfhd.u32();
  defaults.flags = tfhd.u32();
  ByteReader tfdt(findBox(traf, boxType("tfdt")));
  tfdt.skip(4);
  TrackPart part;
  part.run.decodeTime = static_cast<int64_t>(tfdt.u64());
  const auto track =
      std::find_if(tracks.begin(), tracks.end(), [&](const MovieTrack& t) { return t.trackID == trackID; });
  const bool isGood = track != tracks.end() && (flags & ~kDefaultDuration) == (kBaseIsMoof | kDefaultFlags) &&
                      part.run.decodeTime >= 0 && part.run.decodeTime < kMaximumTime && !tfhd.failed() &&
                      !tfdt.failed();
  if (!isGood) return std::nullopt;
  part.run.track = static_cast<size_t>(track - tracks.begin());
  while (auto box = takeBox(traf)) {
    if (box->type != boxType("trun")) continue;
    part.isWhole = readRun(ByteReader(box->content), defaults, part.run);
    if (!part.isWhole) break;
  }
  return part.run.entries.empty() ? std::nullopt : std::optional(std::move(part));
}

/// A fragment has one part of a track at most: one of the two is somebody else's.
bool isTwice(const std::vector<TrackPart>& parts, size_t track) {
  return std::ranges::count(parts, track, [](const TrackPart& part) { return part.run.track; }) > 1;
}

/// The bytes of the sample are units of a picture, each after its length.
bool isWholePicture(const FileBoxes& boxes, uint64_t offset, uint64_t size) {
  constexpr uint64_t kUnitHead = 5;
  constexpr uint8_t kForbiddenBit = 0x80;
  const uint64_t end = offset + size;
  while (offset < end) {
    if (end - offset < kUnitHead) return false;
    const auto head = boxes.read(offset, kUnitHead);
    ByteReader in(head);
    const uint64_t length = in.u32();
    if (in.left() == 0 || length == 0 || length > end - offset - 4) return false;
    if ((in.number(1) & kForbiddenBit) != 0) return false;
    offset += 4 + length;
  }
  return size > 0;
}

/// Leaves the samples in front of the first that is damaged or does not end before `end`.
void keepWhole(const FileBoxes& boxes, SampleRun& run, uint64_t end, bool isPictures) {
  uint64_t offset = run.offset;
  size_t count = 0;
  for (; count < run.entries.size(); ++count) {
    const uint64_t size = run.entries[count].size;
    if (offset + size > end || (isPictures && !isWholePicture(boxes, offset, size))) break;
    offset += size;
  }
  run.entries.resize(count);
  run.size = offset - run.offset;
}

/// The end of a damaged fragment's head, which its media follows.
std::optional<uint64_t> findHeadEnd(const FileBoxes& boxes, uint64_t from, uint64_t to) {
  const auto head = boxes.at(from);
  const bool isHead = head && head->end() + kMediaHeadSize <= to && head->size <= kMaximumHeadSize;
  const auto follows = isHead ? boxes.find(boxType("mdat"), head->end() + 4, head->end() + 8) : std::nullopt;
  if (follows) return head->end();
  const auto found = boxes.find(boxType("mdat"), from + kMediaHeadSize + 4, std::min(to, from + kMaximumHeadSize));
  if (found) return *found - 4;
  return isHead && head->type == boxType("moof") ? std::optional(head->end()) : std::nullopt;
}

/// What the head of one damaged fragment tells of its samples. Its media ends before `to`.
std::vector<SampleRun> readDamagedFragment(const FileBoxes& boxes, uint64_t from, uint64_t headEnd, uint64_t to,
                                           const std::vector<MovieTrack>& tracks) {
  const auto bytes = boxes.read(from + 8, headEnd - from - 8);
  const auto mediaHead = boxes.read(headEnd, std::min<uint64_t>(4, boxes.size() - headEnd));
  const uint64_t claimedEnd = headEnd + ByteReader(mediaHead).u32();
  // A torn end lacks media; before another fragment, what lies there counts.
  const uint64_t mediaEnd = to == boxes.size() && claimedEnd > to ? claimedEnd : to;
  std::span<const uint8_t> content(bytes);
  std::vector<TrackPart> parts;
  while (auto box = takeBox(content)) {
    if (box->type != boxType("traf")) continue;
    if (auto part = readPart(box->content, tracks)) {
      part->run.offset += from;
      parts.push_back(std::move(*part));
    }
  }
  std::vector<SampleRun> runs;
  for (size_t i = 0; i < parts.size(); ++i) {
    SampleRun run = parts[i].run;
    const bool isPictures = tracks[run.track].kind == MovieTrack::Kind::Video;
    const uint64_t begins = i == 0 ? headEnd + kMediaHeadSize : parts[i - 1].run.end();
    const uint64_t ends = i + 1 < parts.size() ? parts[i + 1].run.offset : mediaEnd;
    const bool fits = parts[i].isWhole && run.offset == begins && run.end() == ends;
    if (run.offset < headEnd + kMediaHeadSize || (!isPictures && !fits) || isTwice(parts, run.track)) continue;
    keepWhole(boxes, run, to, isPictures);
    if (!run.entries.empty()) runs.push_back(std::move(run));
  }
  return runs;
}

}  // namespace

std::optional<Fragment> readFragment(const FileBoxes& boxes, uint64_t offset, const std::vector<MovieTrack>& tracks) {
  const auto head = boxes.at(offset);
  if (!head || head->type != boxType("moof")) return std::nullopt;
  const auto data = boxes.at(head->end());
  if (!data || data->type != boxType("mdat")) return std::nullopt;
  const auto bytes = boxes.read(*head);
  if (bytes.empty()) return std::nullopt;
  Fragment fragment;
  fragment.end = data->end();
  uint64_t expected = data->offset + data->headSize;
  auto content = std::span(bytes).subspan(head->headSize);
  while (auto box = takeBox(content)) {
    if (box->type != boxType("traf")) continue;
    auto part = readPart(box->content, tracks);
    if (!part || !part->isWhole) return std::nullopt;
    SampleRun& run = part->run;
    run.offset += offset;
    const bool isNext = fragment.runs.empty() || run.track > fragment.runs.back().track;
    if (run.offset != expected || !isNext) return std::nullopt;
    expected = run.end();
    fragment.runs.push_back(std::move(run));
  }
  if (fragment.runs.empty() || expected != fragment.end) return std::nullopt;
  return fragment;
}

std::optional<uint64_t> findFragment(const FileBoxes& boxes, uint64_t from, const std::vector<MovieTrack>& tracks) {
  for (uint64_t at = from;;) {
    const auto found = boxes.find(boxType("moof"), at + 4, boxes.size());
    if (!found) return std::nullopt;
    if (readFragment(boxes, *found - 4, tracks)) return *found - 4;
    at = *found;
  }
}

std::vector<SampleRun> readDamaged(const FileBoxes& boxes, uint64_t from, uint64_t to,
                                   const std::vector<MovieTrack>& tracks) {
  std::vector<SampleRun> runs;
  while (from < to) {
    const auto found = boxes.find(boxType("moof"), from + 8, to);
    const uint64_t next = found ? *found - 4 : to;
    if (const auto headEnd = findHeadEnd(boxes, from, next)) {
      for (SampleRun& run : readDamagedFragment(boxes, from, *headEnd, next, tracks)) runs.push_back(std::move(run));
    }
    from = next;
  }
  return runs;
}

}  // namespace qv::platform::mp4
