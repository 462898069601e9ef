#pragma once

#include <string>

#include "platform/MovieSalvage.h"

namespace qv::platform::mp4 {

/// Salvages the files of MovieWriter. A file that a DiskMovieFile holds open is in use.
///
/// Threading: thread-safe.
class MP4MovieSalvage final : public MovieSalvage {
 public:
  Result<MovieState> stateOfMovie(const std::string& path) override;
  Result<MediaTime> salvageMovie(const std::string& path) override;
};

}  // namespace qv::platform::mp4
