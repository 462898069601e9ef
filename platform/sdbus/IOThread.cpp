#include "platform/sdbus/IOThread.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>

#include "platform/threads/Log.h"

namespace qv::platform::sdbus {

IOThread::IOThread() : epoll_(::epoll_create1(EPOLL_CLOEXEC)), event_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  epoll_event event{};
  event.events = EPOLLIN;
  if (::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, event_.get(), &event) != 0) {
    QV_LOG_ERROR(logs::kIPC, "no event descriptors: %s", std::strerror(errno));
  }
}

IOThread::~IOThread() { stop(); }

void IOThread::post(std::function<void()> work) {
  std::lock_guard lock(mutex_);
  if (stopping_) return;
  posted_.push_back(std::move(work));
  if (!thread_.joinable()) {
    // Signals belong to the main run loop.
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    thread_ = std::thread([this] { run(); });
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
  }
  if (posted_.size() == 1) wake();
}

void IOThread::stop() {
  post([this] { quit_ = true; });
  {
    std::lock_guard lock(mutex_);
    stopping_ = true;
  }
  if (thread_.joinable()) thread_.join();
  // What was left may hold its owner, and this.
  std::deque<std::function<void()>> dropped;
  std::lock_guard lock(mutex_);
  dropped.swap(posted_);
  watches_.clear();
  timers_.clear();
}

void IOThread::wake() {
  const uint64_t one = 1;
  // The counter cannot overflow: it is written once per batch.
  (void)!::write(event_.get(), &one, sizeof one);
}

IOThread::Token IOThread::watch(int fd, uint32_t epollEvents, EventHandler handler) {
  const Token token = nextToken_++;
  watches_[token] = std::make_shared<EventHandler>(std::move(handler));
  epoll_event event{};
  event.events = epollEvents;
  event.data.u64 = token;
  if (::epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, fd, &event) != 0) {
    QV_LOG_ERROR(logs::kIPC, "cannot watch a descriptor: %s", std::strerror(errno));
  }
  return token;
}

void IOThread::modify(Token token, int fd, uint32_t epollEvents) {
  epoll_event event{};
  event.events = epollEvents;
  event.data.u64 = token;
  ::epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, fd, &event);
}

void IOThread::unwatch(Token token, int fd) {
  watches_.erase(token);
  if (fd >= 0) ::epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, fd, nullptr);
}

IOThread::Token IOThread::after(std::chrono::milliseconds delay, std::function<void()> work) {
  const Token token = nextToken_++;
  timers_.emplace(std::chrono::steady_clock::now() + delay, Timer{token, std::move(work)});
  return token;
}

void IOThread::cancel(Token timer) {
  std::erase_if(timers_, [timer](const auto& entry) { return entry.second.token == timer; });
}

int IOThread::timeoutInMilliseconds() const {
  if (timers_.empty()) return -1;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(timers_.begin()->first - Time::clock::now());
  return static_cast<int>(std::clamp<int64_t>(left.count(), 0, 1 << 30));
}

void IOThread::run() {
  std::array<epoll_event, 64> events;
  while (!quit_) {
    const int count = ::epoll_wait(epoll_.get(), events.data(), events.size(), timeoutInMilliseconds());
    for (int i = 0; i < count; ++i) {
      const auto it = watches_.find(events[i].data.u64);
      if (it == watches_.end()) continue;
      const auto handler = it->second;  // it may end its own watch
      (*handler)(events[i].events);
    }
    runTimers();
    runPosted();
  }
}

void IOThread::runPosted() {
  uint64_t count = 0;
  (void)!::read(event_.get(), &count, sizeof count);
  std::deque<std::function<void()>> batch;
  {
    std::lock_guard lock(mutex_);
    batch.swap(posted_);
  }
  for (auto& work : batch) {
    work();
    work = nullptr;
  }
}

void IOThread::runTimers() {
  const Time now = Time::clock::now();
  while (!timers_.empty() && timers_.begin()->first <= now) {
    auto work = std::move(timers_.begin()->second.work);
    timers_.erase(timers_.begin());
    work();
  }
}

}  // namespace qv::platform::sdbus
