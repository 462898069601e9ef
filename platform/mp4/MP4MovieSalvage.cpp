#include "platform/mp4/MP4MovieSalvage.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>
#include <memory>

#include "platform/mp4/MovieFile.h"
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

}  // namespace

Result<MovieState> MP4MovieSalvage::stateOfMovie(const std::string& path) {
  const auto movie = openMovie(path, O_RDONLY, LOCK_SH);
  if (!movie && movie.error().code == EWOULDBLOCK) return MovieState::InUse;
  if (!movie) return movie.error();
  const auto isFinished = isFinishedMovie(FileBoxes(movie.value().file->fd(), movie.value().size));
  if (!isFinished) return isFinished.error();
  return isFinished.value() ? MovieState::Finished : MovieState::Unfinished;
}

Result<MediaTime> MP4MovieSalvage::salvageMovie(const std::string& path) {
  auto movie = openMovie(path, O_RDWR, LOCK_EX);
  if (!movie) return movie.error();
  const FileBoxes boxes(movie->file->fd(), movie->size);
  const auto isFinished = isFinishedMovie(boxes);
  if (!isFinished) return isFinished.error();
  if (isFinished.value()) return MediaTime::invalid();
  auto remains = readRemains(boxes);
  if (!remains) return remains.error();
  if (!remains->hasPicture()) return MediaTime::zero();

  const uint64_t end = remains->end;
  MovieFile& disk = *movie->file;
  MovieWriter writer(std::move(movie->file), std::move(remains->tracks), MovieWriter::Layout::Fragmented);
  writer.adopt(remains->placeholder, end, std::move(remains->index));
  const auto length = static_cast<int64_t>(writer.movieDuration({}));
  if (length == 0) return MediaTime::zero();
  if (const int failure = disk.truncate(end); failure != 0) return Error::posix(failure, path);
  if (const auto error = writer.finish({})) return *error;
  return MediaTime::make(length, kMovieTimescale);
}

}  // namespace qv::platform::mp4
