#include "platform/threads/Timer.h"

#include <condition_variable>
#include <map>
#include <mutex>
#include <thread>

namespace qv::platform {
namespace {

using SteadyClock = std::chrono::steady_clock;

struct Entry {
  std::function<void()> work;
  std::chrono::nanoseconds period{0};  // 0: once
  bool cancelled = false;
};

/// Never destroyed: its thread is detached and sleeps until something is due.
class SystemTimers final : public TimerService {
 public:
  std::unique_ptr<TimerHandle> after(std::chrono::nanoseconds delay, std::function<void()> work) override {
    return add(delay, std::make_shared<Entry>(Entry{std::move(work), {}}));
  }
  std::unique_ptr<TimerHandle> every(std::chrono::nanoseconds period, std::function<void()> work) override {
    return add(period, std::make_shared<Entry>(Entry{std::move(work), period}));
  }

 private:
  class Handle final : public TimerHandle {
   public:
    Handle(SystemTimers& timers, std::shared_ptr<Entry> entry) : timers_(timers), entry_(std::move(entry)) {}
    ~Handle() override {
      std::lock_guard lock(timers_.mutex_);
      entry_->cancelled = true;
      std::erase_if(timers_.due_, [&](const auto& item) { return item.second == entry_; });
    }

   private:
    SystemTimers& timers_;
    std::shared_ptr<Entry> entry_;
  };

  std::unique_ptr<TimerHandle> add(std::chrono::nanoseconds delay, std::shared_ptr<Entry> entry) {
    std::lock_guard lock(mutex_);
    due_.emplace(SteadyClock::now() + delay, entry);
    if (!started_) {
      started_ = true;
      std::thread([this] { run(); }).detach();
    }
    changed_.notify_one();
    return std::make_unique<Handle>(*this, std::move(entry));
  }

  void run() {
    std::unique_lock lock(mutex_);
    for (;;) {
      if (due_.empty()) {
        changed_.wait(lock);
        continue;
      }
      const auto next = due_.begin();
      if (SteadyClock::now() < next->first) {
        const auto deadline = next->first;
        changed_.wait_until(lock, deadline);
        continue;
      }
      const auto deadline = next->first;
      std::shared_ptr<Entry> entry = next->second;
      due_.erase(next);
      if (entry->period.count() > 0) due_.emplace(deadline + entry->period, entry);
      lock.unlock();
      entry->work();
      lock.lock();
    }
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::multimap<SteadyClock::time_point, std::shared_ptr<Entry>> due_;
  bool started_ = false;
};

}  // namespace

TimerService& systemTimers() {
  static SystemTimers* const timers = new SystemTimers;
  return *timers;
}

}  // namespace qv::platform
