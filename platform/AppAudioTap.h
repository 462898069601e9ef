#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "platform/base/Audio.h"

namespace qv::platform {

/// One buffer of a tap queue, owned by the queue.
struct QueueBuffer {
  uint32_t capacity = 0;  ///< bytes
  uint8_t* data = nullptr;
  uint32_t byteSize = 0;  ///< valid bytes
};

/// An audio input queue that records what one process (and its children) plays.
///
/// Every operation answers a 32-bit status, 0 for success. A running queue takes enqueued buffers
/// in turn, fills them and hands them to the input callback; while the process plays nothing it
/// records silence, so audio time never stops. A buffer is handed over when it is full or, as long
/// as most buffers are back in the queue, after about 20 ms of audio, and at a stop. Audio that finds
/// no buffer is dropped. The sample clock is the host clock's.
///
/// Threading: operations from one thread at a time; callbacks come on the queue's own thread. `stop`
/// and `dispose` wait for a callback in progress (unless called from one); none comes afterwards, so a
/// callback must not wait for whoever stops the queue.
/// An operation that the platform refuses leaves the queue usable for `dispose`; destruction
/// disposes.
class AppAudioTapQueue {
 public:
  virtual ~AppAudioTapQueue() = default;
  virtual int32_t setTappedProcess(int32_t processID) = 0;
  virtual int32_t streamDescription(AudioStreamDescription& description) = 0;
  virtual int32_t maximumOutputPacketSize(uint32_t& bytes) = 0;
  virtual int32_t allocateBuffer(uint32_t byteSize, QueueBuffer*& buffer) = 0;
  virtual int32_t enqueueBuffer(QueueBuffer* buffer) = 0;
  /// One listener: called after each change of the is-running property.
  virtual int32_t addIsRunningListener(std::function<void()> listener) = 0;
  virtual int32_t removeIsRunningListener() = 0;
  /// The queue is running as soon as its clock runs, whether or not the process plays.
  virtual int32_t start() = 0;
  /// Hands over what was played up to the call, waiting 50 ms at most for what is still on its way; called
  /// from a callback it only stops.
  virtual int32_t stop() = 0;
  virtual int32_t freeBuffer(QueueBuffer* buffer) = 0;
  virtual int32_t dispose() = 0;
};

/// A filled buffer: the start time of its first frame (host time valid only during the call) and
/// its packet count.
using AppAudioInputCallback =
    std::function<void(QueueBuffer* buffer, const AudioTimeStamp& startTime, uint32_t packetCount)>;

class AppAudioTapService {
 public:
  virtual ~AppAudioTapService() = default;
  /// 16-bit big-endian mono at 44.1 kHz is always accepted. Another status than 0, and no queue,
  /// where the format is not.
  virtual int32_t createInputQueue(const AudioStreamDescription& format, AppAudioInputCallback callback, uint32_t flags,
                                   std::unique_ptr<AppAudioTapQueue>& queue) = 0;
};

}  // namespace qv::platform
