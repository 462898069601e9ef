#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "platform/mp4/ByteWriter.h"
#include "platform/mp4/MovieTrack.h"
#include "platform/mp4/TrackIndex.h"

namespace qv::platform::mp4 {

/// The size of the box that stands before a recording's first fragment, and of the 64-bit "mdat"
/// head that takes its place at the finish.
inline constexpr uint64_t kPlaceholderSize = 16;

void writeFileType(ByteWriter& out);
/// An empty "free" box of kPlaceholderSize.
void writePlaceholder(ByteWriter& out);
/// The head of a media data box of `size` bytes, head included.
void writeMediaDataHead(ByteWriter& out, uint64_t size);

/// The header of a file of fragments: no samples, no durations.
void writeFragmentedHeader(ByteWriter& out, std::span<const MovieTrack> tracks);

/// A track of a finished movie.
struct IndexedTrack {
  const MovieTrack* track;
  const TrackIndex* index;
  /// How long its presentation lasts, after its start delay, in kMovieTimescale.
  uint64_t duration;
};
/// The header of a finished movie.
void writeMovieHeader(ByteWriter& out, std::span<const IndexedTrack> tracks);

/// The head of one fragment: "moof", and the head of the "mdat" that `samples` follow, track by
/// track in this order.
struct FragmentTrack {
  const MovieTrack* track;
  std::span<const EncodedSample> samples;
};
void writeFragmentHead(ByteWriter& out, uint32_t sequenceNumber, std::span<const FragmentTrack> tracks);

}  // namespace qv::platform::mp4
