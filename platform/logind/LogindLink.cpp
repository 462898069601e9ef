#include "platform/logind/LogindLink.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/epoll.h>

#include <algorithm>
#include <cstring>
#include <ctime>
#include <utility>

#include "platform/threads/Log.h"

namespace qv::platform::logind {
namespace {

constexpr const char kService[] = "org.freedesktop.login1";
constexpr const char kPath[] = "/org/freedesktop/login1";
constexpr const char kManager[] = "org.freedesktop.login1.Manager";
constexpr const char kWho[] = "quorveld";
constexpr const char kWhy[] = "The screen is being recorded";

std::chrono::nanoseconds timeOf(clockid_t clock) {
  timespec time{};
  ::clock_gettime(clock, &time);
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

/// How long the device has slept since it was booted: only one of the two clocks counts that.
std::chrono::nanoseconds sleptSoFar() { return timeOf(CLOCK_BOOTTIME) - timeOf(CLOCK_MONOTONIC); }

int openBus(const std::string& address, sd_bus** bus) {
  if (address.empty()) return sd_bus_open_system(bus);
  int r = sd_bus_new(bus);
  if (r >= 0) r = sd_bus_set_address(*bus, address.c_str());
  if (r >= 0) r = sd_bus_set_bus_client(*bus, 1);
  return r < 0 ? r : sd_bus_start(*bus);
}

void tellMissing(const char* what, const char* why) {
  QV_LOG_INFO(logs::kPlatform, "%s: %s; the device may sleep while it records", what, why);
}

}  // namespace

void LogindLink::open() {
  loop_.post([this] { connect(); });
}

void LogindLink::close() {
  loop_.post([this] {
    release(idle_);
    release(sleep_);
    disconnect();
  });
}

void LogindLink::setHandlers(SuspendHandlers handlers) {
  std::lock_guard lock(mutex_);
  handlers_ = std::move(handlers);
}

SuspendHandlers LogindLink::handlers() {
  std::lock_guard lock(mutex_);
  return handlers_;
}

void LogindLink::connect() {
  sd_bus* opened = nullptr;
  const int r = openBus(busAddress_, &opened);
  bus_.reset(opened);
  if (r < 0) {
    bus_.reset();
    return tellMissing("system bus", std::strerror(-r));
  }
  watch_ = loop_.watch(sd_bus_get_fd(opened), EPOLLIN, [this](uint32_t) { process(); });
  (void)sd_bus_match_signal_async(opened, nullptr, kService, kPath, kManager, "PrepareForSleep", onPrepareForSleep,
                                  nullptr, this);
  inhibit(idle_);
  inhibit(sleep_);
  process();
}

void LogindLink::disconnect() {
  timer_.end();
  // sd-bus closes a broken connection's descriptor by itself.
  if (bus_ && sd_bus_get_fd(bus_.get()) < 0) watch_.forget();
  watch_.end();
  // What is still queued is not waited for.
  bus_.reset();
}

void LogindLink::process() {
  int r = 1;
  while (bus_ && r > 0) r = sd_bus_process(bus_.get(), nullptr);
  if (!bus_) return;
  const int events = r < 0 ? r : sd_bus_get_events(bus_.get());
  if (events < 0) {
    tellMissing("system bus lost", std::strerror(-events));
    return disconnect();
  }
  watch_.setEvents((events & POLLIN ? uint32_t{EPOLLIN} : 0) | (events & POLLOUT ? uint32_t{EPOLLOUT} : 0));
  watchTimeout();
}

/// sd-bus bounds the time of the authentication and of calls.
void LogindLink::watchTimeout() {
  timer_.end();
  uint64_t due = UINT64_MAX;
  if (sd_bus_get_timeout(bus_.get(), &due) < 0 || due == UINT64_MAX) return;
  const auto left =
      std::chrono::ceil<std::chrono::milliseconds>(std::chrono::microseconds(due) - timeOf(CLOCK_MONOTONIC));
  timer_ = loop_.after(std::max(left, std::chrono::milliseconds(0)), [this] { process(); });
}

void LogindLink::inhibit(Inhibitor& inhibitor) {
  inhibitor.isWanted = true;
  const int r = sd_bus_call_method_async(bus_.get(), nullptr, kService, kPath, kManager, "Inhibit", onInhibited,
                                         &inhibitor, "ssss", inhibitor.what, kWho, kWhy, inhibitor.mode);
  if (r < 0) tellMissing(inhibitor.what, std::strerror(-r));
}

void LogindLink::release(Inhibitor& inhibitor) {
  inhibitor.isWanted = false;
  inhibitor.lock.reset();
}

int LogindLink::onInhibited(sd_bus_message* reply, void* userdata, sd_bus_error*) {
  auto& inhibitor = *static_cast<Inhibitor*>(userdata);
  int lock = -1;
  if (const sd_bus_error* error = sd_bus_message_get_error(reply)) {
    tellMissing("logind", error->message != nullptr ? error->message : error->name);
  } else if (inhibitor.isWanted && sd_bus_message_read(reply, "h", &lock) >= 0) {
    inhibitor.lock.reset(::fcntl(lock, F_DUPFD_CLOEXEC, 3));  // the message owns its own
  }
  return 0;
}

int LogindLink::onPrepareForSleep(sd_bus_message* signal, void* link, sd_bus_error*) {
  int starts = 0;
  if (sd_bus_message_read(signal, "b", &starts) >= 0) static_cast<LogindLink*>(link)->prepareForSleep(starts != 0);
  return 0;
}

void LogindLink::prepareForSleep(bool starts) {
  const SuspendHandlers told = handlers();
  if (!starts) {
    inhibit(sleep_);
    if (told.didWake) told.didWake(std::max(sleptSoFar() - sleptBefore_, std::chrono::nanoseconds(0)));
    return;
  }
  sleptBefore_ = sleptSoFar();
  // The descriptor goes with the last who holds it; the device sleeps then.
  const auto hold = std::make_shared<FileDescriptor>(std::move(sleep_.lock));
  release(sleep_);
  if (told.willSleep) told.willSleep(hold);
}

}  // namespace qv::platform::logind
