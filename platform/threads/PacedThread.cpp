#include "platform/threads/PacedThread.h"

#include <condition_variable>
#include <mutex>

namespace qv::platform {

struct PacedThread::State {
  explicit State(PacedClock& c) : clock(c) {}
  void run();

  PacedClock& clock;
  std::mutex mutex;
  std::condition_variable changed;
  bool stopping = false;
  bool ended = false;
  std::function<TimePoint()> step;  // the thread's own
  std::function<void()> finish;     // the thread's own
};

void PacedThread::State::run() {
  std::unique_lock lock(mutex);
  while (!stopping) {
    lock.unlock();
    const TimePoint next = step();
    lock.lock();
    clock.waitUntil(next, lock, changed, [this] { return stopping; });
  }
  lock.unlock();
  if (finish) finish();
  step = nullptr;
  finish = nullptr;
  lock.lock();
  ended = true;
  changed.notify_all();
}

PacedThread::PacedThread(std::function<TimePoint()> step, std::function<void()> finish, PacedClock& clock)
    : state_(std::make_shared<State>(clock)) {
  state_->step = std::move(step);
  state_->finish = std::move(finish);
  thread_ = std::thread([state = state_] { state->run(); });
}

PacedThread::~PacedThread() {
  stop();
  if (isCurrent()) {
    thread_.detach();
  } else {
    thread_.join();
  }
}

void PacedThread::stop() {
  std::unique_lock lock(state_->mutex);
  state_->stopping = true;
  state_->changed.notify_all();
  if (isCurrent()) return;
  state_->changed.wait(lock, [this] { return state_->ended; });
}

}  // namespace qv::platform
