#pragma once

#include <functional>

#include "platform/base/SampleBuffer.h"

namespace qv {

/// One recording's hold on the microphone. Its end stops what it has started and no other's; what was heard up to then
/// has reached the output handler when the destructor returns, and nothing reaches it later.
///
/// Threading: thread-safe. The output handler is called on the capture sample queue and must accept an absent sample (a
/// filler that could not be made); the did-start handler on the platform's thread, perhaps while the lease ends. The
/// destructor waits for the audio dispatch queue and the capture sample queue: it must not run on them, nor with a lock
/// held that a handler takes.
class MicrophoneLease {
 public:
  using OutputHandler = std::function<void(const platform::SampleBufferRef&)>;
  using DidStartHandler = std::function<void()>;

  virtual ~MicrophoneLease() = default;
};

}  // namespace qv
