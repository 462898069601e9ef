#include "platform/mp4/MovieRemains.h"

#include <algorithm>
#include <limits>

#include "platform/mp4/FragmentReader.h"
#include "platform/mp4/HeaderReader.h"
#include "platform/mp4/MovieHeader.h"
#include "platform/mp4/MovieWriter.h"
#include "platform/mp4/RunTimes.h"

namespace qv::platform::mp4 {
namespace {

/// The header of an unfinished movie takes less.
constexpr uint64_t kMaximumWithoutMedia = 64u << 10;

Error notOurs(const char* what) { return movieError(kMovieNotReadable, what); }

/// All that is left, in the order of the file. After damage it goes on at the next whole fragment.
std::vector<SampleRun> walkFragments(const FileBoxes& boxes, uint64_t at, const std::vector<MovieTrack>& tracks) {
  std::vector<SampleRun> found;
  const auto add = [&](std::vector<SampleRun> runs) {
    for (SampleRun& run : runs) found.push_back(std::move(run));
  };
  while (at < boxes.size()) {
    if (auto fragment = readFragment(boxes, at, tracks)) {
      add(std::move(fragment->runs));
      at = fragment->end;
      continue;
    }
    const uint64_t next = findFragment(boxes, at + 1, tracks).value_or(boxes.size());
    add(readDamaged(boxes, at, next, tracks));
    at = next;
  }
  return found;
}

int64_t inMovieTime(int64_t ticks, const MovieTrack& track) {
  return static_cast<int64_t>(static_cast<__int128>(ticks) * kMovieTimescale / track.timescale);
}

/// An index counts from its first sample: a track whose beginning is lost begins later.
void moveStart(MovieTrack& track, int64_t firstTime) {
  constexpr int64_t kLongestDelay = std::numeric_limits<uint32_t>::max();
  const int64_t delay = inMovieTime(std::max<int64_t>(firstTime - track.mediaStart, 0), track);
  if (delay <= kLongestDelay) track.startDelay = static_cast<uint64_t>(delay);
  track.mediaStart = std::max<int64_t>(track.mediaStart - firstTime, 0);
}

TrackIndex indexOf(const std::vector<SampleRun>& runs, MovieTrack& track) {
  TrackIndex index;
  const auto times = timesOf(runs);
  if (runs.empty()) return index;
  const int64_t first = times.front().front();
  moveStart(track, first);
  for (size_t i = 0; i < runs.size(); ++i) {
    uint64_t offset = runs[i].offset;
    for (size_t j = 0; j < runs[i].entries.size(); ++j) {
      const auto& entry = runs[i].entries[j];
      index.add(times[i][j] - first, entry.duration, entry.size, entry.isSync, offset, j == 0);
      offset += entry.size;
    }
  }
  return index;
}

/// The movie begins with its first track that has anything left.
void closeGapAtStart(MovieRemains& remains) {
  uint64_t earliest = std::numeric_limits<uint64_t>::max();
  for (size_t i = 0; i < remains.tracks.size(); ++i) {
    if (!remains.index[i].isEmpty()) earliest = std::min(earliest, remains.tracks[i].startDelay);
  }
  for (size_t i = 0; i < remains.tracks.size(); ++i) {
    if (!remains.index[i].isEmpty()) remains.tracks[i].startDelay -= earliest;
  }
}

void indexRuns(std::vector<SampleRun> found, MovieRemains& remains) {
  std::vector<std::vector<SampleRun>> runs(remains.tracks.size());
  for (SampleRun& run : found) runs[run.track].push_back(std::move(run));
  for (size_t i = 0; i < runs.size(); ++i) remains.index.push_back(indexOf(runs[i], remains.tracks[i]));
  closeGapAtStart(remains);
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

/// The index that the file ends with, wherever that begins. In a finished movie whose beginning is damaged nothing else
/// tells.
std::optional<FileBox> findIndexAtEnd(const FileBoxes& boxes) {
  const uint64_t size = boxes.size();
  for (uint64_t from = size - std::min(size, FileBoxes::kMaximumSize);;) {
    const auto found = boxes.find(boxType("moov"), from, size);
    if (!found) return std::nullopt;
    const auto box = *found >= 4 ? boxes.at(*found - 4) : std::nullopt;
    if (box && box->end() == size && !readIndexedSamples(boxes, *box).empty()) return box;
    from = *found + 4;
  }
}

/// What is written last must be whole, where nothing tells that it reached the disk.
std::optional<WrittenIndex> readWrittenIndex(const FileBoxes& boxes) {
  const auto box = findIndexAtEnd(boxes);
  const auto bytes = box ? boxes.read(*box) : std::vector<uint8_t>();
  if (bytes.size() <= 8 || !hasWholeTables(std::span(bytes).subspan(8))) return std::nullopt;
  ByteReader head(findBox(std::span(bytes).subspan(8), boxType("mvhd")));
  head.skip(4 + 16 + 4);
  const uint64_t duration = head.u64();
  const bool isLength = duration > 0 && duration < static_cast<uint64_t>(kMaximumTime);
  return head.failed() || !isLength ? std::nullopt : std::optional(WrittenIndex{box->offset, duration});
}

}  // namespace

bool MovieRemains::hasPicture() const {
  for (size_t i = 0; i < tracks.size(); ++i) {
    if (tracks[i].kind == MovieTrack::Kind::Video && !index[i].isEmpty()) return true;
  }
  return false;
}

bool holdsNoMedia(const FileBoxes& boxes) {
  if (boxes.size() > kMaximumWithoutMedia) return false;
  ByteWriter type;
  writeFileType(type);
  const auto wanted = type.bytes().first(std::min<size_t>(type.size(), boxes.size()));
  if (!std::ranges::equal(boxes.read(0, wanted.size()), wanted)) return false;
  return !boxes.find(boxType("moof"), 0, boxes.size()) && !boxes.find(boxType("mdat"), 0, boxes.size());
}

Result<MovieState> readMovieState(const FileBoxes& boxes) {
  const auto beginning = readBeginning(boxes);
  if (beginning) {
    const auto& [second, third] = beginning.value();
    if (second.type == boxType("free") && second.size == kPlaceholderSize && isHeader(third))
      return MovieState::Unfinished;
    const bool isMedia = second.type == boxType("mdat") && second.headSize == kPlaceholderSize;
    if (isMedia && isHeader(third) && !readIndexedSamples(boxes, *third).empty()) return MovieState::Finished;
  }
  if (findIndexAtEnd(boxes)) return MovieState::Finished;
  if (holdsNoMedia(boxes)) return MovieState::Unfinished;
  return beginning ? notOurs("neither a header nor an index") : beginning.error();
}

Result<MovieRemains> readRemains(const FileBoxes& boxes) {
  const auto beginning = readBeginning(boxes);
  if (!beginning || !isHeader(beginning.value().third)) return notOurs("no header");
  const FileBox& header = *beginning.value().third;
  MovieRemains remains;
  remains.placeholder = beginning.value().second.offset;
  remains.writtenIndex = readWrittenIndex(boxes);
  if (remains.writtenIndex) return remains;
  const auto bytes = boxes.read(header);
  if (bytes.size() > 8) remains.tracks = readTracks(std::span(bytes).subspan(8));
  if (remains.tracks.empty()) return notOurs("no tracks");
  indexRuns(walkFragments(boxes, header.end(), remains.tracks), remains);
  if (!remains.hasPicture()) return notOurs("no picture");
  return remains;
}

}  // namespace qv::platform::mp4
