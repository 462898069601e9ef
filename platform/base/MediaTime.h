#pragma once

#include <compare>
#include <cstdint>

namespace qv::platform {

/// A rational media time, value / timescale seconds.
///
/// Its raw 24-byte layout crosses process boundaries inside SampleTimingInfo,
/// in the device's byte order.
///
/// Threading: a value.
struct MediaTime {
  enum Flags : uint32_t {
    kValid = 1u << 0,
    kHasBeenRounded = 1u << 1,
    kPositiveInfinity = 1u << 2,
    kNegativeInfinity = 1u << 3,
    kIndefinite = 1u << 4,
  };

  int64_t value = 0;
  int32_t timescale = 0;
  uint32_t flags = 0;
  int64_t epoch = 0;

  /// All fields zero.
  static constexpr MediaTime invalid() { return {}; }
  /// Value 0, timescale 1, valid.
  static constexpr MediaTime zero() { return {0, 1, kValid, 0}; }
  static constexpr MediaTime make(int64_t value, int32_t timescale) { return {value, timescale, kValid, 0}; }
  /// Rounds to the nearest tick of `timescale`, halves away from zero. A time that does
  /// not fit (or NaN) becomes an infinity (or the invalid time).
  static MediaTime fromSeconds(double seconds, int32_t timescale);

  [[nodiscard]] constexpr bool isValid() const { return (flags & kValid) != 0; }
  /// Valid, with a positive timescale and neither infinite nor indefinite.
  [[nodiscard]] constexpr bool isNumeric() const {
    return isValid() && timescale > 0 && (flags & (kPositiveInfinity | kNegativeInfinity | kIndefinite)) == 0;
  }
  /// Seconds as a double; 0 for a time without a numeric value.
  [[nodiscard]] double seconds() const;
  /// The same instant at another timescale, rounded to nearest, halves away from zero.
  [[nodiscard]] MediaTime convertedTo(int32_t newTimescale) const;
  /// The exact arithmetic value at another timescale, saturated to 64 bits.
  [[nodiscard]] int64_t valueAt(int32_t newTimescale) const;
};
static_assert(sizeof(MediaTime) == 24, "crosses process boundaries as 24 raw bytes");

/// The timescale of the host clock (CLOCK_MONOTONIC), in ticks per second.
inline constexpr int32_t kHostTimescale = 1'000'000'000;

/// -1, 0 or 1. Numeric times compare as rationals; infinities at the ends; invalid first.
int compare(const MediaTime& a, const MediaTime& b);
inline bool operator==(const MediaTime& a, const MediaTime& b) { return compare(a, b) == 0; }
inline std::strong_ordering operator<=>(const MediaTime& a, const MediaTime& b) { return compare(a, b) <=> 0; }

/// Rational sum and difference. The result keeps the common timescale where there is one,
/// else the larger timescale that holds both exactly, rounded where none fits.
MediaTime operator+(const MediaTime& a, const MediaTime& b);
MediaTime operator-(const MediaTime& a, const MediaTime& b);

/// Duration, presentation and decode time of one sample.
struct SampleTimingInfo {
  MediaTime duration;
  MediaTime presentationTimeStamp;
  MediaTime decodeTimeStamp;
};
static_assert(sizeof(SampleTimingInfo) == 72, "crosses process boundaries as 72 raw bytes");

struct MediaTimeRange {
  MediaTime start;
  MediaTime duration;
};

}  // namespace qv::platform
