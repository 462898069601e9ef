#pragma once

#include <cstdint>
#include <vector>

#include "platform/base/Result.h"
#include "platform/mp4/FileBoxes.h"
#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/TrackIndex.h"

namespace qv::platform::mp4 {

/// What the file of a recording that was cut off holds: the index of its whole fragments.
struct MovieRemains {
  uint64_t placeholder = 0;  ///< offset of the box that a finish makes the head of the media
  uint64_t end = 0;          ///< of the last whole fragment
  std::vector<MovieTrack> tracks;
  std::vector<TrackIndex> index;
  [[nodiscard]] bool hasPicture() const;
};

/// Whether a movie has been finished. An error where it is none of MovieWriter's.
Result<bool> isFinishedMovie(const FileBoxes& boxes);
/// Reads an unfinished movie's fragments, up to the first that is not whole.
Result<MovieRemains> readRemains(const FileBoxes& boxes);

}  // namespace qv::platform::mp4
