#include "sdk/client/ApplicationCallbacks.h"

namespace qv::client {

ApplicationCallbacks::ApplicationCallbacks(Executor executor, platform::Executor& threads)
    : queue_("com.tarnwick.quorvel.callbacks", threads), executor_(std::move(executor)) {}

void ApplicationCallbacks::post(std::function<void()> callback) {
  auto work = [self = shared_from_this(), callback = std::move(callback)] { self->gate_.enter(callback); };
  if (executor_) {
    executor_(std::move(work));
  } else {
    queue_.async(std::move(work));
  }
}

void ApplicationCallbacks::postSample(SampleKind kind, std::function<void()> callback) {
  auto& waiting = kind == SampleKind::Video ? waitingVideo_ : waitingAudio_;
  const int most = kind == SampleKind::Video ? kMaxWaitingVideo : kMaxWaitingAudio;
  if (waiting.fetch_add(1) >= most) {
    waiting.fetch_sub(1);
    ++dropped_;
    return;
  }
  // Counts down when the sample is let go, whether its callback ran or the executor dropped it.
  std::shared_ptr<void> slot(nullptr, [self = shared_from_this(), &waiting](void*) { waiting.fetch_sub(1); });
  post([slot = std::move(slot), callback = std::move(callback)] { callback(); });
}

}  // namespace qv::client
