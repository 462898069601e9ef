#include "platform/threads/SerialQueue.h"

#include <cstdio>
#include <cstdlib>
#include <vector>

namespace qv::platform {

struct SerialQueue::State : std::enable_shared_from_this<SerialQueue::State> {
  State(std::string name, Executor* runs, std::shared_ptr<State> above)
      : label(std::move(name)), executor(runs), target(std::move(above)) {}

  void enqueue(std::function<void()> work);
  void scheduleDrain(std::unique_lock<std::mutex>& lock);
  void drain();
  void runQueuedItems(std::unique_lock<std::mutex>& lock);
  void waitForTurn(std::unique_lock<std::mutex>& lock, const std::function<void()>& work);
  void runItem(const std::function<void()>& work);
  void runSync(const std::function<void()>& work);
  bool isCurrent() const;

  const std::string label;
  Executor* const executor;             // of a root queue
  const std::shared_ptr<State> target;  // of any other
  std::mutex mutex;
  std::deque<std::function<void()>> items;
  bool running = false;    // some thread runs the items
  bool scheduled = false;  // a drain is posted
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
  std::unique_lock lock(mutex);
  items.push_back(std::move(work));
  scheduleDrain(lock);
}

/// Posts a drain unless somebody runs the items already. Releases the lock.
void SerialQueue::State::scheduleDrain(std::unique_lock<std::mutex>& lock) {
  if (running || scheduled || items.empty()) return;
  scheduled = true;
  lock.unlock();
  executor->post([self = shared_from_this()] { self->drain(); });
}

void SerialQueue::State::drain() {
  std::unique_lock lock(mutex);
  scheduled = false;
  if (running) return;
  running = true;
  runQueuedItems(lock);
  running = false;
}

void SerialQueue::State::runQueuedItems(std::unique_lock<std::mutex>& lock) {
  while (!items.empty()) {
    auto work = std::move(items.front());
    items.pop_front();
    lock.unlock();
    runItem(work);
    work = nullptr;
    lock.lock();
  }
}

void SerialQueue::State::runSync(const std::function<void()>& work) {
  if (target) {
    target->runSync([this, &work] { runItem(work); });
    return;
  }
  std::unique_lock lock(mutex);
  if (running) {
    waitForTurn(lock, work);
    return;
  }
  running = true;
  runQueuedItems(lock);
  lock.unlock();
  runItem(work);
  lock.lock();
  running = false;
  scheduleDrain(lock);
}

void SerialQueue::State::waitForTurn(std::unique_lock<std::mutex>& lock, const std::function<void()>& work) {
  std::mutex doneMutex;
  std::condition_variable doneCondition;
  bool done = false;
  items.push_back([&] {
    work();
    // Notify under the lock: the waiter may destroy the condition as soon as it can see `done`.
    std::lock_guard doneLock(doneMutex);
    done = true;
    doneCondition.notify_one();
  });
  lock.unlock();
  std::unique_lock doneLock(doneMutex);
  doneCondition.wait(doneLock, [&] { return done; });
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
