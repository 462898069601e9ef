#pragma once

#include <cstdint>
#include <string>

#include "platform/base/MediaTime.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// What became of a movie's recording.
enum class MovieState : int32_t {
  Finished,    ///< an ordinary movie
  Unfinished,  ///< its recording was cut off by a crash or a loss of power
  InUse,       ///< somebody, maybe another process, is writing it
};

/// Finishes movies that a crash of the daemon or a loss of power left unfinished, and that may be damaged besides.
/// Nothing that a movie holds is ever taken away: what can be played is named by an index behind it.
///
/// Works on plain files only; a symbolic link is not followed. Both operations take as long as reading the
/// movie's index does, not its media: some tens of milliseconds for an hour. Damaged stretches are read whole.
/// An error of the posix domain is of the file, any other of its content.
///
/// Threading: thread-safe, blocking.
class MovieSalvage {
 public:
  virtual ~MovieSalvage() = default;
  /// Finished is what has its index, whatever else is odd about it. An error where the file cannot be read or is no
  /// movie of AssetWriter's.
  virtual Result<MovieState> stateOfMovie(const std::string& path) = 0;
  /// Finishes an unfinished movie as its recording would have: the index is appended, of all samples that can be told;
  /// after a damaged stretch it goes on with the next fragment that is whole. Gives the movie's length when the file
  /// was read back. Zero where no media was ever written into it, and then the file is as it was. A finished movie is
  /// not touched, and its length not looked for: an invalid time.
  ///
  /// An error where the file is none of AssetWriter's, is in use, holds no picture that can be found, or cannot be
  /// written. The file is then as it was.
  virtual Result<MediaTime> salvageMovie(const std::string& path) = 0;
};

}  // namespace qv::platform
