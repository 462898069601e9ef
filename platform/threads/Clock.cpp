#include "platform/threads/Clock.h"

#include <ctime>

namespace qv::platform {
namespace {

class SystemClock final : public Clock {
 public:
  Date now() const override {
    timespec t{};
    ::clock_gettime(CLOCK_REALTIME, &t);
    return {static_cast<double>(t.tv_sec) + static_cast<double>(t.tv_nsec) * 1e-9};
  }
  MediaTime hostTime() const override { return MediaTime::make(hostNanoseconds(), kHostTimescale); }
};

}  // namespace

Clock& systemClock() {
  static SystemClock clock;
  return clock;
}

int64_t hostNanoseconds() {
  timespec t{};
  ::clock_gettime(CLOCK_MONOTONIC, &t);
  return int64_t{t.tv_sec} * kHostTimescale + t.tv_nsec;
}

}  // namespace qv::platform
