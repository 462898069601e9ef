#pragma once

#include <cstdint>
#include <deque>
#include <optional>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/MovieReader.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::ffmpeg {

/// A stretch of a movie, in mp4::kMovieTimescale.
struct ExportRange {
  int64_t start = 0;
  int64_t end = 0;
};

/// Copies the packets of one track that a range needs: from the key frame before its start (sound:
/// from one packet more than is heard) to its end. What comes before the start is hidden by the
/// track's edit list.
///
/// Threading: confined to one thread.
class TrackCopier {
 public:
  static Result<TrackCopier> create(const AVStream& stream, uint32_t trackID, const ExportRange& range);

  /// Takes the track's next packet; adds to `out` what is known to be needed.
  void add(const AVPacket& packet, std::vector<mp4::EncodedSample>& out);
  /// The movie has no more packets.
  void finish(std::vector<mp4::EncodedSample>& out);
  /// No packet of the track that follows is needed.
  [[nodiscard]] bool isDone() const { return done_; }
  /// Whether the track's media goes on to the end of the range, or nearly.
  [[nodiscard]] bool reachedEnd() const;
  /// Its description, complete once the copy is.
  [[nodiscard]] const mp4::MovieTrack& track() const { return track_; }

 private:
  TrackCopier() = default;
  mp4::EncodedSample makeSample(const AVPacket& packet) const;
  /// The start has passed: what was held is needed.
  void begin(std::vector<mp4::EncodedSample>& out);
  void alignWithStart();

  struct Held {
    mp4::EncodedSample sample;
    int64_t presentationTime;
  };
  mp4::MovieTrack track_;
  bool isByteStream_ = false;
  int64_t start_ = 0;  ///< of the range, in the track's timescale
  int64_t end_ = 0;
  int64_t lastEnd_ = 0;
  int64_t base_ = 0;  ///< decode time of the first sample copied
  bool begun_ = false;
  bool done_ = false;
  std::deque<Held> held_;
};

}  // namespace qv::platform::ffmpeg
