#include "platform/ffmpeg/RecordingTimeline.h"

#include <algorithm>
#include <cstdlib>

namespace qv::platform::ffmpeg {
namespace {

/// Smaller changes of the distance are rounding.
constexpr int64_t kTolerance = 10'000;

}  // namespace

void RecordingTimeline::observe(int64_t captureTime, int64_t presentationTime) {
  const int64_t distance = captureTime - presentationTime;
  if (!isAnchored()) {
    distance_ = distance;
    horizon_ = captureTime;
    segments_.push_back({sessionStart_ + distance, kOpen, 0});
    return;
  }
  if (std::abs(distance - distance_) > kTolerance) {
    Segment& current = segments_.back();
    current.end = std::max(current.start, horizon_);
    const int64_t start = current.end + std::max<int64_t>(0, distance - distance_);
    segments_.push_back({start, kOpen, start - distance - sessionStart_});
    distance_ = distance;
  }
  horizon_ = std::max(horizon_, captureTime);
}

int64_t RecordingTimeline::movieHorizon() const {
  if (!isAnchored()) return 0;
  return horizon_ - segments_.back().start + segments_.back().movieTime;
}

}  // namespace qv::platform::ffmpeg
