#include "platform/threads/Executor.h"

#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <thread>

namespace qv::platform {
namespace {

constexpr size_t kMaximumThreads = 64;
constexpr int kBackgroundNice = 10;
/// Long against the pauses within a recording, so that its work makes no threads over and over.
constexpr std::chrono::seconds kIdleLife{2};

/// The pool is never destroyed, so work at process end is safe. A thread without work for a while ends: what one busy
/// moment took is given back after it.
class ThreadPool final : public Executor {
 public:
  explicit ThreadPool(int nice) : nice_(nice) {}

  void post(std::function<void()> work) override {
    std::lock_guard lock(mutex_);
    queue_.push_back(std::move(work));
    if (idle_ >= queue_.size() || threads_ >= kMaximumThreads) {
      wake_.notify_one();
    } else {
      ++threads_;
      std::thread([this] { run(); }).detach();
    }
  }

 private:
  void run() {
    // A lower priority is a courtesy; where it is refused the work still gets done.
    if (nice_ != 0) (void)::setpriority(PRIO_PROCESS, static_cast<id_t>(::syscall(SYS_gettid)), nice_);
    std::unique_lock lock(mutex_);
    for (;;) {
      ++idle_;
      const bool hasWork = wake_.wait_for(lock, kIdleLife, [this] { return !queue_.empty(); });
      --idle_;
      if (!hasWork) {
        --threads_;
        return;
      }
      auto work = std::move(queue_.front());
      queue_.pop_front();
      lock.unlock();
      work();
      work = nullptr;
      lock.lock();
    }
  }

  const int nice_;
  std::mutex mutex_;
  std::condition_variable wake_;
  std::deque<std::function<void()>> queue_;
  size_t idle_ = 0;
  size_t threads_ = 0;
};

}  // namespace

Executor& globalQueue() {
  static ThreadPool* const pool = new ThreadPool(0);
  return *pool;
}

Executor& globalBackgroundQueue() {
  static ThreadPool* const pool = new ThreadPool(kBackgroundNice);
  return *pool;
}

}  // namespace qv::platform
