#include "platform/threads/EventLoop.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <deque>
#include <map>
#include <mutex>
#include <thread>
#include <unordered_map>
#include <utility>

#include "platform/base/FileDescriptor.h"
#include "platform/threads/Log.h"

namespace qv::platform {

/// What the loop, its thread and its handles share.
///
/// Threading: `mutex` guards what changes; handlers, and the destructors of what they hold, run outside it.
struct EventLoop::State : std::enable_shared_from_this<EventLoop::State> {
  using Time = std::chrono::steady_clock::time_point;
  struct Watched {
    int fd;
    std::shared_ptr<EventHandler> handler;
  };
  struct Due {
    uint64_t token;
    Work work;
  };
  /// What a loop lets go of at its end. It may hold the loop's owner.
  struct Held {
    std::deque<Work> posted;
    std::unordered_map<uint64_t, Watched> watches;
    std::multimap<Time, Due> timers;
  };

  State();
  void wakeLocked();
  void run();
  void runEvents(const epoll_event* events, int count);
  void runTimers();
  bool runPosted();
  int timeoutInMilliseconds();
  void letGo();
  uint64_t addWatch(int fd, uint32_t epollEvents, EventHandler handler);
  uint64_t addTimer(std::chrono::milliseconds delay, Work work);
  void setEvents(uint64_t token, uint32_t epollEvents);
  void end(uint64_t token, bool isClosed = false);
  void unwatchLocked(int fd, uint64_t token, bool isClosed);

  const FileDescriptor epoll;
  const FileDescriptor event;
  std::mutex mutex;
  Held held;
  /// Which watch a descriptor's number stands for in the kernel's set: the last that was made with it.
  std::unordered_map<int, uint64_t> watchOfDescriptor;
  bool isStopping = false;
  bool isWoken = false;
  uint64_t lastToken = 0;  // 0 is the eventfd
  std::thread thread;
  std::thread::id threadID;
};

EventLoop::State::State() : epoll(::epoll_create1(EPOLL_CLOEXEC)), event(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  epoll_event readable{};
  readable.events = EPOLLIN;
  if (::epoll_ctl(epoll.get(), EPOLL_CTL_ADD, event.get(), &readable) != 0) {
    QV_LOG_ERROR(logs::kPlatform, "no event descriptors: %s", std::strerror(errno));
  }
}

/// Has the thread look at what is new, and starts it when there is none. The thread holds the state.
void EventLoop::State::wakeLocked() {
  if (!thread.joinable()) {
    // Signals belong to the main run loop.
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    thread = std::thread([self = shared_from_this()] { self->run(); });
    threadID = thread.get_id();
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
  }
  if (threadID == std::this_thread::get_id() || std::exchange(isWoken, true)) return;
  // The counter cannot overflow: it is written once per turn.
  (void)!::eventfd_write(event.get(), 1);
}

void EventLoop::State::run() {
  std::array<epoll_event, 64> events;
  do {
    const int count = ::epoll_wait(epoll.get(), events.data(), events.size(), timeoutInMilliseconds());
    runEvents(events.data(), count);
    runTimers();
  } while (runPosted());
  letGo();
}

int EventLoop::State::timeoutInMilliseconds() {
  std::lock_guard lock(mutex);
  if (!held.posted.empty() || isStopping) return 0;
  if (held.timers.empty()) return -1;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(held.timers.begin()->first - Time::clock::now());
  return static_cast<int>(std::clamp<int64_t>(left.count(), 0, 1 << 30));
}

void EventLoop::State::runEvents(const epoll_event* events, int count) {
  for (int i = 0; i < count; ++i) {
    std::shared_ptr<EventHandler> handler;  // it may end its own watch
    {
      std::lock_guard lock(mutex);
      const auto it = held.watches.find(events[i].data.u64);
      if (it != held.watches.end() && !isStopping) handler = it->second.handler;
    }
    if (handler) (*handler)(events[i].events);
  }
}

void EventLoop::State::runTimers() {
  const Time now = Time::clock::now();
  std::unique_lock lock(mutex);
  while (!isStopping && !held.timers.empty() && held.timers.begin()->first <= now) {
    auto work = std::move(held.timers.begin()->second.work);
    held.timers.erase(held.timers.begin());
    lock.unlock();
    work();
    work = nullptr;
    lock.lock();
  }
}

/// False when the loop was stopped before.
bool EventLoop::State::runPosted() {
  std::deque<Work> batch;
  bool goesOn = true;
  {
    std::lock_guard lock(mutex);
    if (std::exchange(isWoken, false)) {
      eventfd_t count = 0;
      (void)!::eventfd_read(event.get(), &count);
    }
    batch.swap(held.posted);
    goesOn = !isStopping;
  }
  for (auto& work : batch) {
    work();
    work = nullptr;
  }
  return goesOn;
}

void EventLoop::State::letGo() {
  Held dropped;
  std::lock_guard lock(mutex);
  std::swap(dropped, held);
}

uint64_t EventLoop::State::addWatch(int fd, uint32_t epollEvents, EventHandler handler) {
  std::lock_guard lock(mutex);
  if (isStopping) return 0;
  const uint64_t token = ++lastToken;
  epoll_event wanted{};
  wanted.events = epollEvents;
  wanted.data.u64 = token;
  if (::epoll_ctl(epoll.get(), EPOLL_CTL_ADD, fd, &wanted) != 0) {
    QV_LOG_ERROR(logs::kPlatform, "cannot watch a descriptor: %s", std::strerror(errno));
    return 0;
  }
  held.watches[token] = {fd, std::make_shared<EventHandler>(std::move(handler))};
  watchOfDescriptor[fd] = token;
  wakeLocked();
  return token;
}

uint64_t EventLoop::State::addTimer(std::chrono::milliseconds delay, Work work) {
  std::lock_guard lock(mutex);
  if (isStopping) return 0;
  const uint64_t token = ++lastToken;
  const auto it = held.timers.emplace(Time::clock::now() + delay, Due{token, std::move(work)});
  if (it == held.timers.begin()) wakeLocked();
  return token;
}

void EventLoop::State::setEvents(uint64_t token, uint32_t epollEvents) {
  std::lock_guard lock(mutex);
  const auto it = held.watches.find(token);
  if (it == held.watches.end()) return;
  epoll_event wanted{};
  wanted.events = epollEvents;
  wanted.data.u64 = token;
  ::epoll_ctl(epoll.get(), EPOLL_CTL_MOD, it->second.fd, &wanted);
}

void EventLoop::State::end(uint64_t token, bool isClosed) {
  Watched watched{};
  Work work;
  std::lock_guard lock(mutex);
  if (const auto it = held.watches.find(token); it != held.watches.end()) {
    watched = std::move(it->second);
    held.watches.erase(it);
    return unwatchLocked(watched.fd, token, isClosed);
  }
  const auto isIt = [token](const auto& entry) { return entry.second.token == token; };
  const auto timer = std::find_if(held.timers.begin(), held.timers.end(), isIt);
  if (timer == held.timers.end()) return;
  work = std::move(timer->second.work);
  held.timers.erase(timer);
}

void EventLoop::State::unwatchLocked(int fd, uint64_t token, bool isClosed) {
  const auto number = watchOfDescriptor.find(fd);
  // Else it was closed before this, and the number stands for another watch by now.
  if (number == watchOfDescriptor.end() || number->second != token) return;
  watchOfDescriptor.erase(number);
  if (!isClosed) ::epoll_ctl(epoll.get(), EPOLL_CTL_DEL, fd, nullptr);
}

EventLoop::EventLoop() : state_(std::make_shared<State>()) {}

EventLoop::~EventLoop() { stop(); }

void EventLoop::post(Work work) {
  std::lock_guard lock(state_->mutex);
  if (state_->isStopping) return;
  state_->held.posted.push_back(std::move(work));
  state_->wakeLocked();
}

void EventLoop::stop() {
  std::thread thread;
  {
    std::lock_guard lock(state_->mutex);
    state_->isStopping = true;
    if (!state_->thread.joinable()) return;
    state_->wakeLocked();
    thread = std::move(state_->thread);
  }
  if (thread.get_id() == std::this_thread::get_id()) {
    thread.detach();
  } else {
    thread.join();
  }
}

EventLoop::Watch EventLoop::watch(int fd, uint32_t epollEvents, EventHandler handler) {
  return {state_, state_->addWatch(fd, epollEvents, std::move(handler))};
}

EventLoop::Timer EventLoop::after(std::chrono::milliseconds delay, Work work) {
  return {state_, state_->addTimer(delay, std::move(work))};
}

bool EventLoop::isCurrent() const {
  std::lock_guard lock(state_->mutex);
  return state_->threadID == std::this_thread::get_id();
}

EventLoop::Timer& EventLoop::Timer::operator=(Timer&& other) noexcept {
  end();
  loop_ = std::move(other.loop_);
  token_ = std::exchange(other.token_, 0);
  return *this;
}

void EventLoop::Timer::end() {
  const uint64_t token = std::exchange(token_, 0);
  if (token == 0) return;
  if (const auto loop = loop_.lock()) loop->end(token);
}

void EventLoop::Watch::forget() {
  const uint64_t token = std::exchange(token_, 0);
  if (const auto loop = loop_.lock()) loop->end(token, true);
}

void EventLoop::Watch::setEvents(uint32_t epollEvents) {
  if (const auto loop = loop_.lock()) loop->setEvents(token_, epollEvents);
}

}  // namespace qv::platform
