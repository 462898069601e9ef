#include "MainLoop.h"

#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <utility>

namespace comet {

namespace {

constexpr int64_t kSecond = 1'000'000'000;

timespec timespecFor(Instant duration) {
  const int64_t ns = std::max<int64_t>(duration.count(), 0);
  return {static_cast<time_t>(ns / kSecond), static_cast<long>(ns % kSecond)};
}

Instant frameInstant(int64_t frame, int framesPerSecond) {
  return Instant(frame / framesPerSecond * kSecond + frame % framesPerSecond * kSecond / framesPerSecond);
}

int64_t frameAfter(Instant instant, int framesPerSecond) {
  const int64_t seconds = instant.count() / kSecond;
  return seconds * framesPerSecond + (instant.count() % kSecond) * framesPerSecond / kSecond + 1;
}

}  // namespace

Instant now() {
  timespec time{};
  ::clock_gettime(CLOCK_MONOTONIC, &time);
  return Instant(int64_t{time.tv_sec} * kSecond + time.tv_nsec);
}

MainLoop::MainLoop() : wakeUp_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGTERM);
  sigaddset(&set, SIGINT);
  // Before any other thread is made, so that none of them takes the signal.
  pthread_sigmask(SIG_BLOCK, &set, nullptr);
  signals_ = ::signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK);
}

MainLoop::~MainLoop() {
  ::close(wakeUp_);
  ::close(signals_);
}

void MainLoop::post(std::function<void()> work) {
  {
    std::lock_guard lock(mutex_);
    posted_.push_back(std::move(work));
  }
  const uint64_t one = 1;
  [[maybe_unused]] const auto written = ::write(wakeUp_, &one, sizeof one);
}

void MainLoop::watch(int fd, std::function<void()> work) {
  watched_ = fd;
  watchWork_ = std::move(work);
}

void MainLoop::everyFrame(int framesPerSecond, std::function<void(Instant, Instant)> work) {
  framesPerSecond_ = framesPerSecond;
  frameWork_ = std::move(work);
  nextFrame_ = frameAfter(now(), framesPerSecond);
}

void MainLoop::at(Instant instant, std::function<void()> work) {
  timer_ = instant;
  timerWork_ = std::move(work);
}

Instant MainLoop::nextWakeUp() const {
  Instant next = Instant::max();
  if (frameWork_) next = frameInstant(nextFrame_, framesPerSecond_);
  return timer_ ? std::min(next, *timer_) : next;
}

void MainLoop::run() {
  while (running_) {
    pollfd fds[] = {{wakeUp_, POLLIN, 0}, {signals_, POLLIN, 0}, {watched_, POLLIN, 0}};
    const Instant next = nextWakeUp();
    const timespec wait = timespecFor(next - now());
    ::ppoll(fds, 3, next == Instant::max() ? nullptr : &wait, nullptr);
    if (fds[1].revents) return;
    runTimers();
    if (fds[2].revents && watchWork_) watchWork_();
    runPosted();
  }
}

void MainLoop::runTimers() {
  if (frameWork_ && frameInstant(nextFrame_, framesPerSecond_) <= now()) {
    const int64_t frame = nextFrame_;
    nextFrame_ = std::max(frame + 1, frameAfter(now(), framesPerSecond_));
    frameWork_(frameInstant(frame, framesPerSecond_), frameInstant(nextFrame_, framesPerSecond_));
  }
  if (timer_ && *timer_ <= now()) {
    timer_.reset();
    std::exchange(timerWork_, {})();
  }
}

void MainLoop::runPosted() {
  uint64_t count = 0;
  [[maybe_unused]] const auto got = ::read(wakeUp_, &count, sizeof count);
  std::deque<std::function<void()>> work;
  {
    std::lock_guard lock(mutex_);
    work.swap(posted_);
  }
  for (auto& each : work) std::exchange(each, {})();
}

}  // namespace comet
