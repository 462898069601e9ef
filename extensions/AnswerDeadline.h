#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>

#include "platform/Platform.h"

namespace qv {

/// How long another process may take for an answer that somebody waits for.
inline constexpr std::chrono::seconds kExtensionPatience{10};

/// A continuation that waits for another process. It runs once: at the answer, at the deadline, or where this is
/// destroyed before.
///
/// Threading: thread-safe. The continuation runs in the thread that answers or destroys, or on the global queue when it
/// is late.
class AnswerDeadline : public std::enable_shared_from_this<AnswerDeadline> {
 public:
  using Continuation = std::function<void(bool isLate)>;
  /// Timers and global queue are the platform's.
  static std::shared_ptr<AnswerDeadline> start(const platform::Platform& platform, std::chrono::nanoseconds patience,
                                               Continuation continuation);
  AnswerDeadline() = default;
  ~AnswerDeadline() { resume(false); }
  AnswerDeadline(const AnswerDeadline&) = delete;
  AnswerDeadline& operator=(const AnswerDeadline&) = delete;
  void answer() { resume(false); }

 private:
  void resume(bool isLate);

  std::mutex mutex_;
  Continuation continuation_;
  std::unique_ptr<platform::TimerHandle> timer_;
};

}  // namespace qv
