#include "platform/base/MediaTime.h"

#include <cmath>
#include <limits>
#include <numeric>

namespace qv::platform {
namespace {

using Wide = __int128;

constexpr int64_t kMax = std::numeric_limits<int64_t>::max();
constexpr int64_t kMin = std::numeric_limits<int64_t>::min();

int64_t saturate(Wide v) {
  if (v > kMax) return kMax;
  if (v < kMin) return kMin;
  return static_cast<int64_t>(v);
}

/// numerator / denominator rounded to nearest, halves away from zero; denominator > 0.
Wide divideRounded(Wide numerator, Wide denominator) {
  const Wide half = denominator / 2;
  return numerator >= 0 ? (numerator + half) / denominator : -((-numerator + half) / denominator);
}

/// Orders what has no numeric value: invalid < -infinity < numbers < +infinity < indefinite.
int rank(const MediaTime& t) {
  if (!t.isValid()) return 0;
  if (t.flags & MediaTime::kNegativeInfinity) return 1;
  if (t.flags & MediaTime::kPositiveInfinity) return 3;
  if (!t.isNumeric()) return 4;
  return 2;
}

MediaTime combine(const MediaTime& a, const MediaTime& b, int sign) {
  if (!a.isNumeric() || !b.isNumeric()) {
    if (rank(a) == 1 || rank(a) == 3) return a;
    if (rank(b) != 1 && rank(b) != 3) return MediaTime::invalid();
    const bool positive = (rank(b) == 3) == (sign > 0);
    return {0, 1, MediaTime::kValid | (positive ? MediaTime::kPositiveInfinity : MediaTime::kNegativeInfinity), 0};
  }
  const int64_t scale = std::lcm<int64_t>(a.timescale, b.timescale);
  if (scale <= std::numeric_limits<int32_t>::max()) {
    const Wide sum = Wide(a.value) * (scale / a.timescale) + sign * Wide(b.value) * (scale / b.timescale);
    if (sum <= kMax && sum >= kMin) return MediaTime::make(static_cast<int64_t>(sum), static_cast<int32_t>(scale));
  }
  const int32_t coarse = std::max(a.timescale, b.timescale);
  const Wide sum = Wide(a.valueAt(coarse)) + sign * Wide(b.valueAt(coarse));
  return {saturate(sum), coarse, MediaTime::kValid | MediaTime::kHasBeenRounded, 0};
}

}  // namespace

MediaTime MediaTime::fromSeconds(double seconds, int32_t timescale) {
  if (std::isnan(seconds) || timescale <= 0) return invalid();
  const double ticks = std::round(seconds * timescale);
  if (ticks >= 9.2233720368547748e18) return {0, 1, kValid | kPositiveInfinity, 0};
  if (ticks <= -9.2233720368547748e18) return {0, 1, kValid | kNegativeInfinity, 0};
  return make(static_cast<int64_t>(ticks), timescale);
}

double MediaTime::seconds() const { return isNumeric() ? static_cast<double>(value) / timescale : 0.0; }

int64_t MediaTime::valueAt(int32_t newTimescale) const {
  if (!isNumeric() || newTimescale <= 0) return 0;
  if (timescale == newTimescale) return value;
  return saturate(divideRounded(Wide(value) * newTimescale, timescale));
}

MediaTime MediaTime::convertedTo(int32_t newTimescale) const {
  if (!isNumeric() || timescale == newTimescale) return *this;
  return {valueAt(newTimescale), newTimescale, flags, epoch};
}

int compare(const MediaTime& a, const MediaTime& b) {
  const int ra = rank(a);
  const int rb = rank(b);
  if (ra != rb) return ra < rb ? -1 : 1;
  if (ra != 2) return 0;
  if (a.epoch != b.epoch) return a.epoch < b.epoch ? -1 : 1;
  const Wide left = Wide(a.value) * b.timescale;
  const Wide right = Wide(b.value) * a.timescale;
  return left < right ? -1 : left > right ? 1 : 0;
}

MediaTime operator+(const MediaTime& a, const MediaTime& b) { return combine(a, b, 1); }
MediaTime operator-(const MediaTime& a, const MediaTime& b) { return combine(a, b, -1); }

}  // namespace qv::platform
