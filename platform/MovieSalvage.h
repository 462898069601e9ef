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

/// Finishes movies that a crash of the daemon or a loss of power left unfinished.
///
/// Works on plain files only; a symbolic link is not followed. Both operations take as long as reading the
/// movie's index does, not its media: some tens of milliseconds for an hour.
///
/// Threading: thread-safe, blocking.
class MovieSalvage {
 public:
  virtual ~MovieSalvage() = default;
  /// An error where the file cannot be read or is no movie of AssetWriter's.
  virtual Result<MovieState> stateOfMovie(const std::string& path) = 0;
  /// Finishes an unfinished movie as its recording would have: a torn end is cut off, the index is
  /// appended. Gives the movie's length; zero where it holds no whole picture, and then the file is as it was. A
  /// finished movie is not touched, and its length not looked for: an invalid time.
  ///
  /// An error where the file is none of AssetWriter's, is in use, or cannot be written. After an error the file
  /// is as it was, or has lost its torn end.
  virtual Result<MediaTime> salvageMovie(const std::string& path) = 0;
};

}  // namespace qv::platform
