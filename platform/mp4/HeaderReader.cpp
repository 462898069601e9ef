#include "platform/mp4/HeaderReader.h"

#include <initializer_list>

#include "platform/mp4/BoxReader.h"

namespace qv::platform::mp4 {
namespace {

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

constexpr std::initializer_list<uint32_t> kSampleTables = {boxType("mdia"), boxType("minf"), boxType("stbl")};

/// The number that a table begins with, of entries of so many bytes; nothing where the table has another length.
std::optional<uint32_t> readCount(std::span<const uint8_t> table, size_t headSize, size_t entrySize) {
  ByteReader in(table);
  in.skip(headSize);
  const uint32_t count = in.u32();
  return in.failed() || in.left() != count * entrySize ? std::nullopt : std::optional(count);
}

uint64_t samplesWithTimes(std::span<const uint8_t> table) {
  ByteReader in(table);
  in.skip(4);
  uint64_t samples = 0;
  for (uint32_t runs = in.u32(); runs > 0 && !in.failed(); --runs) {
    samples += in.u32();
    in.skip(4);
  }
  return in.failed() || in.left() > 0 ? 0 : samples;
}

bool hasWholeTablesOfTrack(std::span<const uint8_t> trak) {
  const auto tables = descend(trak, kSampleTables);
  const auto sizes = readCount(findBox(tables, boxType("stsz")), 8, 4);
  const auto chunks = readCount(findBox(tables, boxType("stco")), 4, 4);
  const auto farChunks = readCount(findBox(tables, boxType("co64")), 4, 8);
  return sizes > 0u && samplesWithTimes(findBox(tables, boxType("stts"))) == *sizes &&
         readCount(findBox(tables, boxType("stsc")), 4, 12) > 0u && (chunks > 0u || farChunks > 0u) && readTrack(trak);
}

}  // namespace

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

std::vector<IndexedSamples> readIndexedSamples(const FileBoxes& boxes, const FileBox& moov) {
  std::vector<IndexedSamples> indexed;
  uint64_t offset = moov.offset + moov.headSize;
  for (auto box = boxes.at(offset); box && box->end() <= moov.end(); box = boxes.at(box->end())) {
    if (box->type != boxType("trak")) continue;
    std::optional<FileBox> sizes = boxes.childOf(*box, boxType("mdia"));
    for (const uint32_t type : {boxType("minf"), boxType("stbl"), boxType("stsz")}) {
      if (sizes) sizes = boxes.childOf(*sizes, type);
    }
    const auto head = boxes.childOf(*box, boxType("tkhd"));
    if (!sizes || !head) continue;
    const auto sizesHead = boxes.read(sizes->offset, std::min<uint64_t>(sizes->size, 20));
    ByteReader count(sizesHead);
    count.skip(16);
    const auto trackHead = boxes.read(head->offset, std::min<uint64_t>(head->size, 32));
    ByteReader trackID(trackHead);
    trackID.skip(28);
    const IndexedSamples samples{trackID.u32(), count.u32()};
    if (samples.count > 0) indexed.push_back(samples);
  }
  return indexed;
}

bool hasWholeTables(std::span<const uint8_t> moov) {
  size_t tracks = 0;
  while (auto box = takeBox(moov)) {
    if (box->type != boxType("trak")) continue;
    if (!hasWholeTablesOfTrack(box->content)) return false;
    ++tracks;
  }
  return tracks > 0 && moov.empty();
}

}  // namespace qv::platform::mp4
