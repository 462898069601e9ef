#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/MovieSalvage.h"
#include "platform/base/Result.h"
#include "platform/mp4/FileBoxes.h"
#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/TrackIndex.h"

namespace qv::platform::mp4 {

/// An index at the end of the file.
struct WrittenIndex {
  uint64_t offset;
  uint64_t duration;  ///< of the movie, in kMovieTimescale
};

/// What the file of a recording that was cut off holds: an index of every sample that can be told, and behind damage
/// those of the next whole fragment and all after it.
struct MovieRemains {
  uint64_t placeholder = 0;  ///< offset of the box that a finish makes the head of the media
  /// Where a finish came so far: only the head of the media is lacking then, and nothing else is looked for.
  std::optional<WrittenIndex> writtenIndex;
  std::vector<MovieTrack> tracks;
  std::vector<TrackIndex> index;
  [[nodiscard]] bool hasPicture() const;
};

/// Finished is what has its index, whatever else is odd about it. An error where the content is none of MovieWriter's,
/// or can not be told to be.
Result<MovieState> readMovieState(const FileBoxes& boxes);
/// Whether the file is a beginning of MovieWriter's into which no media was ever written, not even in part.
bool holdsNoMedia(const FileBoxes& boxes);
/// Reads an unfinished movie. An error where no picture is found in it.
Result<MovieRemains> readRemains(const FileBoxes& boxes);

}  // namespace qv::platform::mp4
