#include "platform/base/BufferQueue.h"

#include <new>

namespace qv::platform {

bool BufferQueue::enqueue(SampleBufferRef sample) {
  if (!sample) return false;
  try {
    samples_.push_back(std::move(sample));
    return true;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

SampleBufferRef BufferQueue::dequeue() {
  if (samples_.empty()) return nullptr;
  SampleBufferRef sample = std::move(samples_.front());
  samples_.pop_front();
  return sample;
}

}  // namespace qv::platform
