#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "platform/mp4/FileBoxes.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::mp4 {

inline constexpr uint32_t kMaximumTrackID = 16;
/// Times of a track are below this.
inline constexpr int64_t kMaximumTime = int64_t{1} << 52;

/// The tracks of a "moov" (its content); none where one of them cannot be read.
std::vector<MovieTrack> readTracks(std::span<const uint8_t> moov);

/// How many samples an index has of a track.
struct IndexedSamples {
  uint32_t trackID;
  uint32_t count;
  bool operator==(const IndexedSamples&) const = default;
};
/// What a "moov" is an index of: those of its tracks that have samples. None in the header of a file of fragments.
std::vector<IndexedSamples> readIndexedSamples(const FileBoxes& boxes, const FileBox& moov);
/// Whether the tables of each track of an index (its content) agree with each other, as far as their sizes tell.
bool hasWholeTables(std::span<const uint8_t> moov);

}  // namespace qv::platform::mp4
