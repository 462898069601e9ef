#pragma once

#include <atomic>
#include <bit>
#include <cstdint>
#include <optional>

namespace qv::platform {

/// Decides when to tell of what happens again and again: at the first time, and then as its number doubles. So a peer
/// that fails with each frame does not fill the log.
///
/// Threading: thread-safe.
class RareLog {
 public:
  /// Counts `more` further times. Where they are to be told, how many there have been; else nothing.
  std::optional<uint64_t> count(uint64_t more = 1) {
    const uint64_t former = count_.fetch_add(more);
    if (std::bit_width(former) == std::bit_width(former + more)) return std::nullopt;
    return former + more;
  }

 private:
  std::atomic<uint64_t> count_{0};
};

}  // namespace qv::platform
