#include "platform/mp4/Salvage.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "platform/mp4/BoxReader.h"
#include "platform/mp4/MovieFile.h"
#include "platform/mp4/MovieHeader.h"
#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/MovieWriter.h"
#include "platform/mp4/TrackIndex.h"

namespace qv::platform::mp4 {
namespace {

/// Heads of fragments take some kilobytes; a header that claims more than this is none of ours.
constexpr uint64_t kMaximumHeaderSize = 16u << 20;
constexpr uint32_t kMaximumTrackID = 16;
constexpr int64_t kMaximumTime = int64_t{1} << 52;

Error notOurs(const char* what) { return movieError(kMovieNotReadable, std::string("movie to salvage: ") + what); }

/// A box of the file, its content not read yet.
struct FileBox {
  uint32_t type = 0;
  uint64_t offset = 0;
  uint64_t headSize = 8;
  uint64_t size = 0;
  [[nodiscard]] uint64_t end() const { return offset + size; }
};

/// Walks over the boxes of a file.
///
/// Threading: confined to one thread.
class FileBoxes {
 public:
  FileBoxes(int fd, uint64_t size) : fd_(fd), size_(size) {}

  /// The box at `offset`; nothing where no whole one is.
  [[nodiscard]] std::optional<FileBox> at(uint64_t offset) const {
    const auto head = read(offset, std::min<uint64_t>(16, size_ - std::min(size_, offset)));
    ByteReader in(head);
    FileBox box;
    box.offset = offset;
    box.size = in.u32();
    box.type = in.u32();
    if (box.size == 1) {
      box.size = in.u64();
      box.headSize = 16;
    }
    if (in.failed() || box.size < box.headSize || box.size > size_ - offset) return std::nullopt;
    return box;
  }

  /// Its bytes, head included; empty when they cannot be read.
  [[nodiscard]] std::vector<uint8_t> read(const FileBox& box) const {
    return box.size > kMaximumHeaderSize ? std::vector<uint8_t>() : read(box.offset, box.size);
  }

 private:
  [[nodiscard]] std::vector<uint8_t> read(uint64_t offset, uint64_t count) const {
    std::vector<uint8_t> bytes(count);
    size_t done = 0;
    while (done < count) {
      const ssize_t got = ::pread(fd_, bytes.data() + done, count - done, static_cast<off_t>(offset + done));
      if (got < 0 && errno == EINTR) continue;
      if (got <= 0) return {};
      done += static_cast<size_t>(got);
    }
    return bytes;
  }

  const int fd_;
  const uint64_t size_;
};

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

/// A run of samples as a fragment's head describes it.
struct SampleRun {
  size_t track;
  int64_t decodeTime;
  uint64_t dataOffset;  ///< from the fragment's beginning
  struct Entry {
    uint32_t duration, size, flags;
  };
  std::vector<Entry> entries;
};

constexpr uint32_t kRunFlags = 0x000701;  // data offset; duration, size and flags of each sample
constexpr uint32_t kNotSyncFlag = 0x00010000;

std::optional<SampleRun> readRun(std::span<const uint8_t> traf, const std::vector<MovieTrack>& tracks) {
  ByteReader tfhd(findBox(traf, boxType("tfhd")));
  tfhd.skip(4);
  const uint32_t trackID = tfhd.u32();
  ByteReader tfdt(findBox(traf, boxType("tfdt")));
  tfdt.skip(4);
  SampleRun run;
  run.decodeTime = static_cast<int64_t>(tfdt.u64());
  ByteReader trun(findBox(traf, boxType("trun")));
  const uint32_t flags = trun.u32();
  const uint32_t count = trun.u32();
  run.dataOffset = trun.u32();
  const auto track =
      std::find_if(tracks.begin(), tracks.end(), [&](const MovieTrack& t) { return t.trackID == trackID; });
  const bool isGood = track != tracks.end() && flags == kRunFlags && count > 0 && trun.left() == size_t{count} * 12 &&
                      run.decodeTime >= 0 && run.decodeTime < kMaximumTime && !tfdt.failed() && !trun.failed();
  if (!isGood) return std::nullopt;
  run.track = static_cast<size_t>(track - tracks.begin());
  for (uint32_t i = 0; i < count; ++i) {
    const uint32_t duration = trun.u32();
    const uint32_t size = trun.u32();
    run.entries.push_back({duration, size, trun.u32()});
  }
  return run;
}

/// Reads a fragment's head; nothing where it is not one of ours or does not fit its media data.
std::optional<std::vector<SampleRun>> readFragment(std::span<const uint8_t> moof, const FileBox& head,
                                                   const FileBox& data, const std::vector<MovieTrack>& tracks) {
  std::vector<SampleRun> runs;
  uint64_t expected = head.size + data.headSize;
  while (auto box = takeBox(moof)) {
    if (box->type != boxType("traf")) continue;
    auto run = readRun(box->content, tracks);
    if (!run || run->dataOffset != expected) return std::nullopt;
    for (const auto& entry : run->entries) expected += entry.size;
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

/// What a file left by a crash holds.
struct Remains {
  uint64_t placeholder = 0;
  uint64_t end = 0;  ///< of the last whole fragment
  std::vector<MovieTrack> tracks;
  std::vector<TrackIndex> index;
};

void walkFragments(const FileBoxes& boxes, Remains& remains) {
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

bool hasPicture(const Remains& remains) {
  for (size_t i = 0; i < remains.tracks.size(); ++i) {
    if (remains.tracks[i].kind == MovieTrack::Kind::Video && !remains.index[i].isEmpty()) return true;
  }
  return false;
}

}  // namespace

std::optional<Error> salvageMovie(const std::string& path) {
  FileDescriptor fd(::open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  struct stat info {};
  if (!fd.isValid() || ::fstat(fd.get(), &info) != 0) return Error::posix(errno, path);
  if (!S_ISREG(info.st_mode)) return notOurs("not a file");
  const FileBoxes boxes(fd.get(), static_cast<uint64_t>(info.st_size));
  const auto type = boxes.at(0);
  if (!type || type->type != boxType("ftyp")) return notOurs("no file type");
  const auto second = boxes.at(type->end());
  if (!second) return notOurs("no header");
  if (second->type == boxType("mdat") && second->headSize == kPlaceholderSize) {
    const auto header = boxes.at(second->end());
    return header && header->type == boxType("moov") ? std::nullopt : std::optional(notOurs("its index is missing"));
  }
  const auto header = boxes.at(second->end());
  if (second->type != boxType("free") || second->size != kPlaceholderSize || !header ||
      header->type != boxType("moov")) {
    return notOurs("no header");
  }
  Remains remains;
  remains.placeholder = second->offset;
  remains.end = header->end();
  const auto bytes = boxes.read(*header);
  if (bytes.size() > 8) remains.tracks = readTracks(std::span(bytes).subspan(8));
  if (remains.tracks.empty()) return notOurs("no tracks");
  remains.index.resize(remains.tracks.size());
  walkFragments(boxes, remains);
  if (!hasPicture(remains)) return movieError(kMovieWithoutMedia, "The movie to salvage has no whole picture.");

  auto file = std::make_unique<DiskMovieFile>(std::move(fd));
  if (const int failure = file->truncate(remains.end); failure != 0) return Error::posix(failure, path);
  MovieWriter writer(std::move(file), std::move(remains.tracks), MovieWriter::Layout::Fragmented);
  writer.adopt(remains.placeholder, remains.end, std::move(remains.index));
  return writer.finish({});
}

}  // namespace qv::platform::mp4
