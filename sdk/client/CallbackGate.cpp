#include "sdk/client/CallbackGate.h"

#include <algorithm>
#include <vector>

namespace qv::client {

namespace {
/// The gates whose callback this thread is running, innermost last.
thread_local std::vector<const CallbackGate*> runningHere;
}  // namespace

CallbackGate::CallbackGate(Executor executor, platform::Executor& threads)
    : queue_("com.tarnwick.quorvel.callbacks", threads), executor_(std::move(executor)) {}

void CallbackGate::post(std::function<void()> callback) {
  auto work = [self = shared_from_this(), callback = std::move(callback)] { self->run(callback); };
  if (executor_) {
    executor_(std::move(work));
  } else {
    queue_.async(std::move(work));
  }
}

void CallbackGate::postSample(SampleKind kind, std::function<void()> callback) {
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

void CallbackGate::run(const std::function<void()>& callback) {
  if (!enter()) return;
  callback();
  leave();
}

bool CallbackGate::enter() {
  std::lock_guard lock(mutex_);
  if (closed_) return false;
  ++running_;
  runningHere.push_back(this);
  return true;
}

void CallbackGate::leave() {
  runningHere.pop_back();
  std::lock_guard lock(mutex_);
  --running_;
  idle_.notify_all();
}

void CallbackGate::close() {
  const auto own = std::count(runningHere.begin(), runningHere.end(), this);
  std::unique_lock lock(mutex_);
  closed_ = true;
  idle_.wait(lock, [&] { return running_ <= own; });
}

}  // namespace qv::client
