#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <map>
#include <mutex>
#include <span>
#include <vector>

namespace qv::platform {

/// The sum of several streams, placed by host time: what nobody played is silence.
///
/// Frames are stereo and counted from the host clock's zero, so that frame n is of the moment
/// n / sampleRate. Holds two seconds; what is older than the last read, or further ahead than
/// that, is left out.
///
/// Threading: thread-safe.
class MixTimeline {
 public:
  explicit MixTimeline(uint32_t sampleRate);

  [[nodiscard]] uint32_t sampleRate() const { return sampleRate_; }
  [[nodiscard]] int64_t frameAt(int64_t hostTime) const;
  /// Adds interleaved stereo frames from frame `position` on.
  void add(int64_t position, std::span<const int16_t> stereo);
  /// The stream `key` has been added up to frame `end`; it is one of the steady ones until `forget`.
  void reached(const void* key, int64_t end);
  void forget(const void* key);
  /// Waits until all steady streams have been added up to `hostTime`, for `limit` at most. A stream that is
  /// more than `stalled` behind has stopped for now and is not waited for.
  void await(uint64_t hostTime, std::chrono::nanoseconds stalled, std::chrono::nanoseconds limit);
  /// Takes out what is at `hostTime`, clipped to 16 bits, as 1 (the mean) or 2 channels.
  void read(uint64_t hostTime, uint32_t channels, std::span<int16_t> samples);

 private:
  const uint32_t sampleRate_;
  const size_t capacity_;  // frames
  std::mutex mutex_;
  std::vector<int32_t> sums_;  // ring of stereo frames; zero where nothing was added
  int64_t next_;               // the first frame not read yet
  std::condition_variable moved_;
  std::map<const void*, int64_t> ends_;
};

}  // namespace qv::platform
