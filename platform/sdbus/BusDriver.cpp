#include "platform/sdbus/BusDriver.h"

#include <poll.h>
#include <sys/epoll.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/sdbus/BusObject.h"
#include "platform/sdbus/IPCContext.h"
#include "platform/threads/Log.h"

namespace qv::platform::sdbus {
namespace {

/// Answers that sd-bus gives by itself (errors, introspection) wait in its own queue: a peer that
/// asks without reading is not read either beyond this many.
constexpr uint64_t kMaximumBusQueue = 64;

}  // namespace

BusDriver::BusDriver(std::shared_ptr<IPCContext> context, FileDescriptor socket, Side side)
    : context_(std::move(context)),
      side_(side),
      outbox_(context_->options),
      backlog_(context_->options),
      socket_(std::move(socket)) {}

void BusDriver::setExportedInterface(const IPCInterface& interface) {
  std::erase_if(exported_, [&](const Exported& other) { return other.table->name() == interface.name; });
  auto table = InterfaceTable::shared(interface);
  auto methods = table->methods(&BusDriver::onMethod);
  exported_.push_back({this, std::move(table), std::move(methods)});
}

void BusDriver::post(void (BusDriver::*work)()) {
  context_->io.post([self = shared_from_this(), work] { ((*self).*work)(); });
}

void BusDriver::resume(std::weak_ptr<BusDriverClient> client) {
  context_->io.post([self = shared_from_this(), client = std::move(client)] {
    self->client_ = client;
    self->open();
  });
}

void BusDriver::flushSoon() {
  if (!isFlushScheduled_.exchange(true)) post(&BusDriver::flush);
}

void BusDriver::readSoon() { post(&BusDriver::processNext); }
void BusDriver::drainAndClose() { post(&BusDriver::drain); }
void BusDriver::closeSoon() { post(&BusDriver::close); }

void BusDriver::endWithService() {
  if (const auto client = client_.lock()) client->serviceEnds();
}

void BusDriver::open() {
  // Opened even when it has been invalidated since: what was sent before that still goes out.
  if (bus_ || !socket_.isValid()) return;
  context_->drivers.insert(shared_from_this());
  const int r = prepareBus();
  if (r < 0) return lost(r);
  process(false, false);
}

int BusDriver::prepareBus() {
  sd_bus* bus = nullptr;
  int r = sd_bus_new(&bus);
  if (r < 0) return r;
  bus_.reset(bus);
  if ((r = connectBus(bus)) < 0) return r;
  if ((r = sd_bus_negotiate_fds(bus, true)) < 0) return r;
  if (side_ == Side::Server) {
    sd_id128_t id{};
    if ((r = sd_id128_randomize(&id)) < 0 || (r = sd_bus_set_server(bus, true, id)) < 0) return r;
    if ((r = addBusObject(bus)) < 0) return r;
  }
  if ((r = sd_bus_add_filter(bus, nullptr, &BusDriver::onMessage, this)) < 0) return r;
  for (Exported& exported : exported_) {
    r = sd_bus_add_object_vtable(bus, nullptr, kObjectPath, exported.table->name().c_str(), exported.methods.data(),
                                 &exported);
    if (r < 0) return r;
  }
  if ((r = sd_bus_start(bus)) < 0) return r;
  watchSocket();
  return watch_ ? 0 : -ENOMEM;
}

void BusDriver::process(bool hangUp, bool writable) {
  const auto self = shared_from_this();
  int budget = kMessagesPerTurn;
  bool goesOn = true;
  while (goesOn && budget-- > 0) {
    if (pausesReading(hangUp) && !writable) break;
    const bool isFed = feed();
    if (!bus_) return;
    // sd-bus writes before it reads, one step a call: with room to write, nothing is read.
    writable = false;
    int r = sd_bus_process(bus_.get(), nullptr);
    if (!bus_) return;
    r = receiveFailure_.value_or(r);
    if (r < 0) return lost(r);
    goesOn = isFed || r > 0;
  }
  updateDeadline();
  flush();
  if (bus_ && goesOn && !backlog_.isPaused()) readSoon();
}

void BusDriver::processNext() {
  if (bus_) process(false, false);
}

bool BusDriver::pausesReading(bool hangUp) {
  if (hangUp) {
    // What a peer sent before it went is at most a socket buffer: it is read even while paused.
    backlog_.readOn();
    return false;
  }
  uint64_t queued = 0;
  const bool isDeaf = sd_bus_get_n_queued_write(bus_.get(), &queued) >= 0 && queued > kMaximumBusQueue;
  return backlog_.pausesReading(isDeaf);
}

void BusDriver::updateWatch() {
  if (pause_) return;
  const int wanted = sd_bus_get_events(bus_.get());
  if (wanted < 0) {
    // Closed by the peer: sd-bus has a last step to do.
    context_->io.post([self = shared_from_this()] {
      if (self->bus_) self->process(true, false);
    });
    return;
  }
  uint32_t events = wanted & POLLOUT ? uint32_t{EPOLLOUT} : 0;
  if ((wanted & POLLIN) && !backlog_.isPaused()) events |= EPOLLIN;
  if (std::exchange(watchedEvents_, events) != events) watch_.setEvents(events);
  updateTimer();
}

/// sd-bus bounds the time of the authentication, and has steps to do without any event.
void BusDriver::updateTimer() {
  timer_.end();
  uint64_t due = UINT64_MAX;
  if (sd_bus_get_timeout(bus_.get(), &due) < 0 || due == UINT64_MAX || backlog_.isPaused()) return;
  const auto now = std::chrono::steady_clock::now().time_since_epoch();
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(std::chrono::microseconds(due) - now);
  timer_ = context_->io.after(std::max(left, std::chrono::milliseconds(0)), [this] { process(false, false); });
}

void BusDriver::drain() {
  if (!bus_) return close();
  drain_.emplace();
  noteProgress();
  awaitProgress(std::chrono::milliseconds(context_->options.drainMilliseconds));
  flush();
}

void BusDriver::noteProgress() {
  if (drain_) drain_->lastProgress = std::chrono::steady_clock::now();
}

void BusDriver::awaitProgress(std::chrono::nanoseconds left) {
  drain_->timer = context_->io.after(std::chrono::ceil<std::chrono::milliseconds>(left), [this] { checkProgress(); });
}

/// A slow peer that still takes what was sent is given its time; one that takes nothing is not.
void BusDriver::checkProgress() {
  const std::chrono::nanoseconds silence = std::chrono::steady_clock::now() - drain_->lastProgress;
  const std::chrono::nanoseconds bound = std::chrono::milliseconds(context_->options.drainMilliseconds);
  if (silence >= bound) return close();
  awaitProgress(bound - silence);
}

void BusDriver::lost(int error) {
  const bool isLeaving = error == -ECONNRESET || error == -EPIPE || error == -ENOTCONN;
  if (!isLeaving && input_) {
    context_->refusals.note(input_->user(), std::string("dropped: ") + std::strerror(-error));
  } else if (!isLeaving) {
    QV_LOG_ERROR(logs::kIPC, "connection dropped: %s", std::strerror(-error));
  }
  if (const auto client = client_.lock()) client->driverLostPeer();
  close();
}

void BusDriver::close() {
  const auto self = shared_from_this();
  watch_.end();
  timer_.end();
  pause_.end();
  deadline_.timer.end();
  drain_.reset();
  received_.clear();
  sentCalls_.clear();
  bus_.reset();
  if (input_) context_->memory.noteGone();
  input_.reset();
  guard_.reset();
  socket_.reset();
  admission_.reset();
  outbox_.clear();
  context_->drivers.erase(self);
  context_->tellWhenIdle();
}

}  // namespace qv::platform::sdbus
