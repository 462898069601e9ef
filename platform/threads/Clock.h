#pragma once

#include "platform/base/MediaTime.h"
#include "platform/base/Value.h"

namespace qv::platform {

/// The two clocks of the system.
///
/// Threading: thread-safe.
class Clock {
 public:
  virtual ~Clock() = default;
  /// The wall clock. It may jump.
  [[nodiscard]] virtual Date now() const = 0;
  /// The host clock (CLOCK_MONOTONIC), timescale kHostTimescale. The clock of screen frames and
  /// of all capture.
  [[nodiscard]] virtual MediaTime hostTime() const = 0;
};

/// The machine's own clocks.
Clock& systemClock();

/// The host clock where pictures and sound are stamped: nanoseconds of CLOCK_MONOTONIC.
int64_t hostNanoseconds();

/// A host time in system units (nanoseconds of CLOCK_MONOTONIC) as a time on the host clock.
constexpr MediaTime mediaTimeFromHostTime(uint64_t hostTime) {
  return MediaTime::make(static_cast<int64_t>(hostTime), kHostTimescale);
}

}  // namespace qv::platform
