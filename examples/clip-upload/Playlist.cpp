#include "Playlist.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

namespace upload {

void Playlist::add(std::string name, double duration, bool isDiscontinuous) {
  longest_ = std::max(longest_, duration);
  entries_.push_back({std::move(name), duration, isDiscontinuous && !entries_.empty()});
}

double Playlist::duration() const {
  double sum = 0;
  for (const Entry& entry : entries_) sum += entry.duration;
  return sum;
}

/// The target duration has a second to spare: it must not change, and clips are a little longer than asked for.
std::string Playlist::text() const {
  std::string text =
      "#EXTM3U\n#EXT-X-VERSION:3\n#EXT-X-TARGETDURATION:" + std::to_string(static_cast<int>(std::ceil(longest_)) + 1) +
      "\n#EXT-X-MEDIA-SEQUENCE:0\n#EXT-X-PLAYLIST-TYPE:EVENT\n";
  for (const Entry& entry : entries_) {
    if (entry.isDiscontinuous) text += "#EXT-X-DISCONTINUITY\n";
    char line[64];
    std::snprintf(line, sizeof line, "#EXTINF:%.6f,\n", entry.duration);
    text += line + entry.name + "\n";
  }
  if (hasEnded_) text += "#EXT-X-ENDLIST\n";
  return text;
}

}  // namespace upload
