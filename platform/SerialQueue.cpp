#include "platform/SerialQueue.h"

#include <cstdio>
#include <cstdlib>
#include <vector>

namespace qv::platform {

struct SerialQueue::State : std::enable_shared_from_this<SerialQueue::State> {
  State(std::string name, Executor* runs, std::shared_ptr<State> above)
      : label(std::move(name)), executor(runs), target(std::move(above)) {}

  void enqueue(std::function<void()> work);
  void drain();
  void runItem(const std::function<void()>& work);
  void runSync(const std::function<void()>& work);
  bool isCurrent() const;

  const std::string label;
  Executor* const executor;             // of a root queue
  const std::shared_ptr<State> target;  // of any other
  std::mutex mutex;
  std::deque<std::function<void()>> items;
  bool busy = false;  // an item runs, or a drain is posted
};

namespace {
/// The queues whose item the thread is running, innermost last.
thread_local std::vector<const void*> currentQueues;
}  // namespace

bool SerialQueue::State::isCurrent() const {
  for (const void* queue : currentQueues) {
    if (queue == this) return true;
  }
  return false;
}

void SerialQueue::State::runItem(const std::function<void()>& work) {
  currentQueues.push_back(this);
  work();
  currentQueues.pop_back();
}

void SerialQueue::State::enqueue(std::function<void()> work) {
  if (target) {
    target->enqueue([self = shared_from_this(), work = std::move(work)] { self->runItem(work); });
    return;
  }
  {
    std::lock_guard lock(mutex);
    items.push_back(std::move(work));
    if (busy) return;
    busy = true;
  }
  executor->post([self = shared_from_this()] { self->drain(); });
}

void SerialQueue::State::drain() {
  for (;;) {
    std::function<void()> work;
    {
      std::lock_guard lock(mutex);
      if (items.empty()) {
        busy = false;
        return;
      }
      work = std::move(items.front());
      items.pop_front();
    }
    runItem(work);
  }
}

void SerialQueue::State::runSync(const std::function<void()>& work) {
  if (target) {
    target->runSync([this, &work] { runItem(work); });
    return;
  }
  {
    std::unique_lock lock(mutex);
    if (!busy) {
      busy = true;
      lock.unlock();
      runItem(work);
      lock.lock();
      if (items.empty()) {
        busy = false;
        return;
      }
      lock.unlock();
      executor->post([self = shared_from_this()] { self->drain(); });
      return;
    }
  }
  std::mutex doneMutex;
  std::condition_variable doneCondition;
  bool done = false;
  enqueue([&] {
    work();
    // Notify under the lock: the waiter may destroy the condition as soon as it can see `done`.
    std::lock_guard lock(doneMutex);
    done = true;
    doneCondition.notify_one();
  });
  std::unique_lock lock(doneMutex);
  doneCondition.wait(lock, [&] { return done; });
}

SerialQueue::SerialQueue(std::string label, Executor& executor)
    : state_(std::make_shared<State>(std::move(label), &executor, nullptr)) {}

SerialQueue::SerialQueue(std::string label, SerialQueue& target)
    : state_(std::make_shared<State>(std::move(label), nullptr, target.state_)) {}

const std::string& SerialQueue::label() const { return state_->label; }

void SerialQueue::async(std::function<void()> work) { state_->enqueue(std::move(work)); }

void SerialQueue::sync(const std::function<void()>& work) {
  if (isOnQueue()) {
    std::fprintf(stderr, "sync on queue %s from itself\n", label().c_str());
    std::abort();
  }
  state_->runSync(work);
}

bool SerialQueue::isOnQueue() const { return state_->isCurrent(); }

void SerialQueue::assertOnQueue() const {
  if (isOnQueue()) return;
  std::fprintf(stderr, "not on queue %s\n", label().c_str());
  std::abort();
}

}  // namespace qv::platform
