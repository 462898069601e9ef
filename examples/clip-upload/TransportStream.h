#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "../common/AVHandles.h"

namespace upload {

/// Puts clips, one after the other, into one MPEG transport stream that is cut at the clips' ends: its segments play
/// as they are, alone and in a row. Nothing is encoded anew. Of the sound, the first track is taken.
///
/// Threading: one thread.
class TransportStream {
 public:
  struct Segment {
    std::vector<uint8_t> bytes;
    double duration = 0;           ///< seconds
    bool isDiscontinuous = false;  ///< its streams are not those of the segment before
  };

  TransportStream() = default;
  ~TransportStream();
  TransportStream(const TransportStream&) = delete;
  TransportStream& operator=(const TransportStream&) = delete;

  /// The movie in `file` as the next segment; nothing, and why in `error`, where it cannot be read.
  [[nodiscard]] std::optional<Segment> append(int file, std::string& error);
  /// A clip is missing: the next segment does not go on from the last.
  void skip() { hasGap_ = true; }

 private:
  struct Track {
    int input = -1, output = -1;
  };
  [[nodiscard]] bool fits(const AVFormatContext& movie, const std::vector<Track>& tracks) const;
  [[nodiscard]] bool begin(const AVFormatContext& movie, std::vector<Track>& tracks);
  [[nodiscard]] int copyPackets(AVFormatContext& movie, const std::vector<Track>& tracks, int64_t& end);
  void close();

  AVFormatContext* stream_ = nullptr;
  std::vector<int64_t> lastTimes_;  // decode time of the last packet, in microseconds, of each stream
  int64_t base_ = 0;                // where the next clip begins, in microseconds
  bool hasGap_ = false;
};

}  // namespace upload
