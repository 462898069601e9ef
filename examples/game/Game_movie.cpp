#include <fcntl.h>
#include <sys/sendfile.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "Game.h"

namespace comet {

namespace {

/// From where `movie` stands to its end. 0 or an errno.
int copyTo(const std::string& path, int movie) {
  const int copy = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
  if (copy < 0) return errno;
  ssize_t count = 0;
  do {
    count = ::sendfile(copy, movie, nullptr, size_t{1} << 30);
  } while (count > 0);
  const int failure = count < 0 ? errno : 0;
  return ::close(copy) == 0 ? failure : errno;
}

}  // namespace

/// The movie lies where nobody but the daemon reads; this is how an application does. (A game that goes on would copy
/// on a thread of its own.)
void Game::keepMovie(const std::string& url) {
  recorder_->openMovie(url, [this](const quorvel::OpenMovieResult& movie) {
    const int failure = movie.error ? 0 : copyTo(options_.keep, movie.file);
    if (movie.error) report(*movie.error);
    if (failure != 0) std::printf("error code=%d text=%s\n", failure, std::strerror(failure));
    if (movie.error || failure != 0) return failScript();
    std::printf("kept path=%s\n", options_.keep.c_str());
    answered();
  });
}

}  // namespace comet
