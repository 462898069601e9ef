#include "platform/mp4/MP4MovieSalvage.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <memory>

#include "platform/mp4/HeaderReader.h"
#include "platform/mp4/MovieFile.h"
#include "platform/mp4/MovieHeader.h"
#include "platform/mp4/MovieRemains.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::mp4 {
namespace {

struct OpenMovie {
  std::unique_ptr<DiskMovieFile> file;
  uint64_t size;
};

/// EWOULDBLOCK where a writer has it. Not every file system has locks: without them nothing is in use.
Result<OpenMovie> openMovie(const std::string& path, int access, int lock) {
  FileDescriptor fd(::open(path.c_str(), access | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  struct stat info {};
  if (!fd.isValid() || ::fstat(fd.get(), &info) != 0) return Error::posix(errno, path);
  if (!S_ISREG(info.st_mode)) return Error::posix(EINVAL, path);
  if (::flock(fd.get(), lock | LOCK_NB) != 0 && errno == EWOULDBLOCK) return Error::posix(EWOULDBLOCK, path);
  return OpenMovie{std::make_unique<DiskMovieFile>(std::move(fd)), static_cast<uint64_t>(info.st_size)};
}

Error notRead(const char* what) { return movieError(kMovieNotReadable, what); }

bool isFinished(const DiskMovieFile& disk, uint64_t size) {
  const auto state = readMovieState(FileBoxes(disk.fd(), size));
  return state && state.value() == MovieState::Finished;
}

/// Whether the index at this offset, as it is read back, has all of the pictures.
bool hasPictures(const FileBoxes& boxes, uint64_t offset, const std::vector<IndexedSamples>& pictures) {
  const auto box = boxes.at(offset);
  if (!box) return false;
  const auto indexed = readIndexedSamples(boxes, *box);
  return std::ranges::all_of(pictures,
                             [&](const IndexedSamples& track) { return std::ranges::count(indexed, track) == 1; });
}

std::vector<IndexedSamples> picturesOf(const MovieRemains& remains) {
  std::vector<IndexedSamples> pictures;
  for (size_t i = 0; i < remains.tracks.size(); ++i) {
    const auto count = static_cast<uint32_t>(remains.index[i].count());
    if (remains.tracks[i].kind == MovieTrack::Kind::Video && count > 0)
      pictures.push_back({remains.tracks[i].trackID, count});
  }
  return pictures;
}

Result<MediaTime> writeHead(DiskMovieFile& disk, uint64_t size, const MovieRemains& remains) {
  ByteWriter head;
  writeMediaDataHead(head, remains.writtenIndex->offset - remains.placeholder);
  if (auto error = writeFully(disk, head.bytes(), remains.placeholder)) return *error;
  if (const int failure = disk.sync(); failure != 0) return Error::posix(failure, "movie file");
  if (!isFinished(disk, size)) return notRead("the head is not read back");
  return MediaTime::make(static_cast<int64_t>(remains.writtenIndex->duration), kMovieTimescale);
}

Result<MediaTime> writeIndex(MovieWriter& writer, const DiskMovieFile& disk,
                             const std::vector<IndexedSamples>& pictures) {
  const uint64_t offset = writer.size();
  const auto length = static_cast<int64_t>(writer.movieDuration({}));
  if (length == 0) return movieError(kMovieWithoutMedia, "the pictures have no duration");
  if (auto error = writer.finish({})) return *error;
  const FileBoxes boxes(disk.fd(), writer.size());
  if (!isFinished(disk, writer.size()) || !hasPictures(boxes, offset, pictures))
    return notRead("the index is not read back");
  return MediaTime::make(length, kMovieTimescale);
}

/// The file as it was. What of this fails is met at the next start: the index alone does no harm.
void undo(DiskMovieFile& disk, uint64_t size, uint64_t offset, std::span<const uint8_t> placeholder) {
  (void)writeFully(disk, placeholder, offset);
  (void)disk.truncate(size);
  (void)disk.sync();
}

}  // namespace

Result<MovieState> MP4MovieSalvage::stateOfMovie(const std::string& path) {
  const auto movie = openMovie(path, O_RDONLY, LOCK_SH);
  if (!movie && movie.error().code == EWOULDBLOCK) return MovieState::InUse;
  if (!movie) return movie.error();
  return readMovieState(FileBoxes(movie.value().file->fd(), movie.value().size));
}

/// All that the file held stays where it was: an index is appended, and the placeholder becomes the head of the media.
Result<MediaTime> MP4MovieSalvage::salvageMovie(const std::string& path) {
  auto movie = openMovie(path, O_RDWR, LOCK_EX);
  if (!movie) return movie.error();
  DiskMovieFile& disk = *movie->file;
  const uint64_t size = movie->size;
  const FileBoxes boxes(disk.fd(), size);
  const auto state = readMovieState(boxes);
  if (!state) return state.error();
  if (state.value() == MovieState::Finished) return MediaTime::invalid();
  if (holdsNoMedia(boxes)) return MediaTime::zero();
  auto remains = readRemains(boxes);
  if (!remains) return remains.error();
  const uint64_t offset = remains->placeholder;
  const auto placeholder = boxes.read(offset, kPlaceholderSize);
  if (placeholder.empty()) return notRead("the placeholder is not read back");
  if (remains->writtenIndex) {
    auto length = writeHead(disk, size, *remains);
    if (!length) undo(disk, size, offset, placeholder);
    return length;
  }
  const auto pictures = picturesOf(*remains);
  MovieWriter writer(std::move(movie->file), std::move(remains->tracks), MovieWriter::Layout::Fragmented);
  writer.adopt(remains->placeholder, size, std::move(remains->index));
  auto length = writeIndex(writer, disk, pictures);
  if (!length) undo(disk, size, offset, placeholder);
  return length;
}

}  // namespace qv::platform::mp4
