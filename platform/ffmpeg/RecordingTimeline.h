#pragma once

#include <cstdint>
#include <optional>
#include <vector>

namespace qv::platform::ffmpeg {

/// Maps capture time to movie time, as the pictures tell it.
///
/// Each picture shows how far its presentation time lies before its capture time. That distance is
/// constant between pauses and grows at each resume. When it grows by d between a picture captured at
/// p and a later one, the capture times [p, p + d) are not part of the movie.
///
/// All times in nanoseconds.
///
/// Threading: confined to one thread.
class RecordingTimeline {
 public:
  /// A stretch of capture time during which the distance is constant.
  struct Segment {
    int64_t start;      ///< capture time
    int64_t end;        ///< capture time, or kOpen
    int64_t movieTime;  ///< of `start`
  };
  static constexpr int64_t kOpen = INT64_MAX;

  /// The presentation time at which the movie begins.
  void begin(int64_t presentationTime) { sessionStart_ = presentationTime; }
  void observe(int64_t captureTime, int64_t presentationTime);

  /// Whether a picture has come: before that nothing can be placed.
  [[nodiscard]] bool isAnchored() const { return !segments_.empty(); }
  /// The latest capture time of a picture: what is captured up to it has a settled place.
  [[nodiscard]] int64_t horizon() const { return horizon_; }
  /// The movie time of the horizon.
  [[nodiscard]] int64_t movieHorizon() const;
  [[nodiscard]] const std::vector<Segment>& segments() const { return segments_; }

 private:
  int64_t sessionStart_ = 0;
  int64_t distance_ = 0;
  int64_t horizon_ = 0;
  std::vector<Segment> segments_;
};

}  // namespace qv::platform::ffmpeg
