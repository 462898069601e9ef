#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/mp4/FileBoxes.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::mp4 {

/// The samples of one track in one fragment, which lie one behind the other in the file.
struct SampleRun {
  size_t track = 0;  ///< in the movie's list of tracks
  int64_t decodeTime = 0;
  uint64_t offset = 0;
  uint64_t size = 0;
  struct Entry {
    uint32_t duration, size;
    bool isSync;
  };
  std::vector<Entry> entries;
  [[nodiscard]] uint64_t end() const { return offset + size; }
};

struct Fragment {
  std::vector<SampleRun> runs;
  uint64_t end = 0;
};

/// The fragment at `offset`; nothing where no whole one is, or none of MovieWriter's.
std::optional<Fragment> readFragment(const FileBoxes& boxes, uint64_t offset, const std::vector<MovieTrack>& tracks);
/// The first whole fragment at or behind `from`, whatever stands before it.
std::optional<uint64_t> findFragment(const FileBoxes& boxes, uint64_t from, const std::vector<MovieTrack>& tracks);
/// What can still be told of the samples between `from` and `to`, where no whole fragment is: of pictures those that
/// are whole by their own structure, in front of the first that is not; of sound, which has no structure, only what
/// lies exactly between its neighbours.
std::vector<SampleRun> readDamaged(const FileBoxes& boxes, uint64_t from, uint64_t to,
                                   const std::vector<MovieTrack>& tracks);

}  // namespace qv::platform::mp4
