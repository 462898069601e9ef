#include "extensions/AnswerDeadline.h"

#include <utility>

namespace qv {

std::shared_ptr<AnswerDeadline> AnswerDeadline::start(const platform::Platform& platform,
                                                      std::chrono::nanoseconds patience, Continuation continuation) {
  auto deadline = std::make_shared<AnswerDeadline>();
  std::lock_guard lock(deadline->mutex_);
  deadline->continuation_ = std::move(continuation);
  deadline->timer_ = platform.timers->after(patience, [weak = std::weak_ptr(deadline), queue = platform.globalQueue] {
    queue->post([weak] {
      if (const auto self = weak.lock()) self->resume(true);
    });
  });
  return deadline;
}

void AnswerDeadline::resume(bool isLate) {
  Continuation continuation;
  std::unique_ptr<platform::TimerHandle> timer;
  {
    std::lock_guard lock(mutex_);
    continuation = std::exchange(continuation_, nullptr);
    timer = std::move(timer_);
  }
  timer.reset();
  if (continuation) continuation(isLate);
}

}  // namespace qv
