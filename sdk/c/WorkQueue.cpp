#include "sdk/c/WorkQueue.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <utility>

namespace qv::c {

std::shared_ptr<WorkQueue> WorkQueue::create() {
  platform::FileDescriptor wake(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!wake.isValid()) return nullptr;
  return std::shared_ptr<WorkQueue>(new WorkQueue(std::move(wake)));
}

void WorkQueue::post(Work work) {
  std::lock_guard lock(mutex_);
  if (isClosed_) return;
  waiting_.push_back(std::move(work));
  ::eventfd_write(wake_.get(), 1);
}

void WorkQueue::close() {
  std::deque<Work> left;
  std::lock_guard lock(mutex_);
  isClosed_ = true;
  left.swap(waiting_);
}

size_t WorkQueue::run() {
  std::deque<Work> due;
  {
    std::lock_guard lock(mutex_);
    eventfd_t count = 0;
    ::eventfd_read(wake_.get(), &count);
    due.swap(waiting_);
  }
  const size_t number = due.size();
  for (; !due.empty(); due.pop_front()) due.front()();
  return number;
}

size_t WorkQueue::wait(int milliseconds) {
  pollfd waited{wake_.get(), POLLIN, 0};
  return ::poll(&waited, 1, milliseconds) > 0 ? run() : 0;
}

}  // namespace qv::c

quorvel_queue* quorvel_queue_create(void) {
  auto work = qv::c::WorkQueue::create();
  return work ? new quorvel_queue{std::move(work)} : nullptr;
}

void quorvel_queue_release(quorvel_queue* queue) {
  if (queue == nullptr) return;
  queue->work->close();
  delete queue;
}

int quorvel_queue_get_descriptor(const quorvel_queue* queue) { return queue->work->descriptor(); }
size_t quorvel_queue_run(quorvel_queue* queue) { return queue->work->run(); }
size_t quorvel_queue_wait(quorvel_queue* queue, int milliseconds) { return queue->work->wait(milliseconds); }
