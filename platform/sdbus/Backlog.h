#pragma once

#include <atomic>
#include <cstddef>

#include "platform/sdbus/SdBusIPC.h"

namespace qv::platform::sdbus {

/// What was received over one connection and waits for its handlers. With too much of it the peer is not read.
///
/// Threading: thread-safe; `pausesReading` on the I/O thread.
class Backlog {
 public:
  explicit Backlog(const SdBusIPCOptions& bounds)
      : maximumMessages_(bounds.maximumUnhandledMessages), maximumBytes_(bounds.maximumUnhandledBytes) {}

  void add(size_t bytes) {
    messages_ += 1;
    bytes_ += bytes;
  }
  /// Whether reading is to go on now: it was paused, and there is room again.
  [[nodiscard]] bool remove(size_t bytes) {
    messages_ -= 1;
    bytes_ -= bytes;
    return isPaused_ && !isTooMuch();
  }
  /// Decides whether the next message is to be read; not even with room where `mustWait`.
  bool pausesReading(bool mustWait) {
    // Said before it is looked at: then the last handler to finish sees one or the other.
    isPaused_ = true;
    isPaused_ = mustWait || isTooMuch();
    return isPaused_;
  }
  void readOn() { isPaused_ = false; }
  [[nodiscard]] bool isPaused() const { return isPaused_; }

 private:
  [[nodiscard]] bool isTooMuch() const { return messages_ > maximumMessages_ || bytes_ > maximumBytes_; }

  const size_t maximumMessages_;
  const size_t maximumBytes_;
  std::atomic<size_t> messages_{0};
  std::atomic<size_t> bytes_{0};
  std::atomic<bool> isPaused_{false};
};

}  // namespace qv::platform::sdbus
