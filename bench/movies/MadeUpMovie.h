#pragma once

#include <cstdint>
#include <string>

namespace qv::bench {

/// What became of a movie of made-up samples: 60 pictures a second at 3 Mbit/s, and tracks of sound at
/// 128 kbit/s.
struct MadeUpMovie {
  double finishMilliseconds = 0;
  uint64_t mediaBytes = 0;
  uint64_t fileBytes = 0;
  int64_t memoryGrowth = 0;  ///< bytes resident, from the first minute to the end
};

/// `keepsBytes`: the whole file comes to be at `path` and is synced before the finish, which is what the finish
/// time is about. Otherwise it is only counted, which tells sizes and memory and spares the disk.
MadeUpMovie makeUpMovie(const std::string& path, int seconds, size_t soundTracks, bool keepsBytes);

int64_t residentBytes();

}  // namespace qv::bench
