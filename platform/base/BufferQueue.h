#pragma once

#include <deque>

#include "platform/base/SampleBuffer.h"

namespace qv::platform {

/// First in, first out; no reordering by time, no capacity limit of its own: its user drains it
/// whenever its input is ready, and the input drops rather than stay busy.
///
/// Threading: confined to its owner's queue.
class BufferQueue {
 public:
  /// False, and nothing queued, when the sample is missing or memory ran out.
  [[nodiscard]] bool enqueue(SampleBufferRef sample);
  /// The oldest sample, or nothing.
  SampleBufferRef dequeue();
  [[nodiscard]] bool isEmpty() const { return samples_.empty(); }
  void reset() { samples_.clear(); }

 private:
  std::deque<SampleBufferRef> samples_;
};

}  // namespace qv::platform
