#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>

#include "platform/threads/CallbackGate.h"
#include "platform/threads/SerialQueue.h"

namespace qv::client {

/// Brings handlers and events to the application, one at a time, until it is closed.
///
/// Captured samples are bounded: where the application does not keep up, new ones are dropped (and
/// counted), so that frames go back to the daemon and memory does not grow.
///
/// Threading: thread-safe.
class ApplicationCallbacks : public std::enable_shared_from_this<ApplicationCallbacks> {
 public:
  using Executor = std::function<void(std::function<void()>)>;
  enum class SampleKind { Video, Audio };
  /// Waiting for the application at most. Video: each holds one of the daemon's few frames.
  static constexpr int kMaxWaitingVideo = 3;
  /// About a second and a half of sound from two sources in 46 ms pieces.
  static constexpr int kMaxWaitingAudio = 64;

  /// Without the application's `executor`, callbacks run on a serial queue of `threads`.
  ApplicationCallbacks(Executor executor, platform::Executor& threads);

  void post(std::function<void()> callback);
  void postSample(SampleKind kind, std::function<void()> callback);
  /// No callback begins from here on, and none is running when this returns, unless called from one.
  void close() { gate_.close(); }
  [[nodiscard]] uint64_t droppedSamples() const { return dropped_; }

 private:
  platform::SerialQueue queue_;
  const Executor executor_;
  platform::CallbackGate gate_;
  std::atomic<int> waitingVideo_ = 0, waitingAudio_ = 0;
  std::atomic<uint64_t> dropped_ = 0;
};

}  // namespace qv::client
