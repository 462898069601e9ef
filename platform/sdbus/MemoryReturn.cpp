#include "platform/sdbus/MemoryReturn.h"

#include <malloc.h>

namespace qv::platform::sdbus {
namespace {

constexpr size_t kMany = 64;
/// They go together: what the last of them leaves is to be given back too.
constexpr std::chrono::seconds kDelay{1};

}  // namespace

void MemoryReturn::noteGone() {
  if (++gone_ < kMany || timer_) return;
  timer_ = loop_.after(kDelay, [this] {
    ::malloc_trim(0);
    gone_ = 0;
    timer_.end();
  });
}

}  // namespace qv::platform::sdbus
