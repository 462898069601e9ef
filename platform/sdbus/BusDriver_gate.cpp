#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "platform/sdbus/BusDriver.h"
#include "platform/sdbus/IPCContext.h"

namespace qv::platform::sdbus {
namespace {

/// How much the kernel may hold for a peer that does not read; it counts twice this, with its own
/// overhead. sd-bus asks for 8 MiB and gets them as root: seconds of sound on top of our own bound.
constexpr int kSocketBufferBytes = 256 << 10;

}  // namespace

/// sd-bus closes what it was given by itself when the connection breaks, so it gets copies.
int BusDriver::connectBus(sd_bus* bus) {
  FileDescriptor output(::fcntl(socket_.get(), F_DUPFD_CLOEXEC, 3));
  if (!output.isValid()) return -errno;
  FileDescriptor input;
  if (guard_) {
    auto opened = openInput();
    if (!opened) return -static_cast<int>(opened.error().code);
    input = std::move(*opened);
  }
  const int r = sd_bus_set_fd(bus, input.isValid() ? input.get() : output.get(), output.get());
  if (r < 0) return r;
  (void)input.release();
  (void)output.release();
  return 0;
}

Result<FileDescriptor> BusDriver::openInput() {
  const uid_t user = guard_->share->quota().user();
  auto authentication = side_ == Side::Server ? authenticationOfClient(user, ::geteuid()) : authenticationOfServer();
  input_ = std::make_unique<GatedInput>(socket_.get(), std::move(authentication), std::move(*guard_));
  guard_.reset();
  return input_->open();
}

/// Whether there is something new for sd-bus to read.
bool BusDriver::feed() {
  if (!input_ || pause_) return false;
  const auto progress = input_->advance(sd_bus_is_ready(bus_.get()) > 0);
  if (progress == GatedInput::Progress::Refused) refuse(input_->refusal());
  if (progress == GatedInput::Progress::Paused) pauseReading();
  return progress == GatedInput::Progress::Moved;
}

/// The loss of a peer is told without being asked for, again and again: it is not watched until it is read again.
void BusDriver::pauseReading() {
  watch_.end();
  pause_ = context_->io.after(input_->beginPause(), [this] {
    pause_.end();
    watchSocket();
    process(false, false);
  });
}

void BusDriver::watchSocket() {
  ::setsockopt(socket_.get(), SOL_SOCKET, SO_SNDBUF, &kSocketBufferBytes, sizeof kSocketBufferBytes);
  watchedEvents_ = EPOLLIN;
  watch_ = context_->io.watch(socket_.get(), watchedEvents_,
                              [this](uint32_t events) { process(events & (EPOLLHUP | EPOLLERR), events & EPOLLOUT); });
}

void BusDriver::updateDeadline() {
  if (!input_ || !input_->isUnfinished()) {
    deadline_.timer.end();
  } else if (!deadline_.timer || deadline_.unit != input_->finishedUnits()) {
    awaitEndOfMessage();
  }
}

void BusDriver::awaitEndOfMessage() {
  deadline_.unit = input_->finishedUnits();
  deadline_.timer = context_->io.after(std::chrono::milliseconds(context_->options.unfinishedMilliseconds), [this] {
    // Of a peer that is not read at the moment, the rest may be there.
    if (pause_ || backlog_.isPaused()) return awaitEndOfMessage();
    refuse("dropped: it does not end what it has begun");
  });
}

void BusDriver::refuse(const std::string& why) {
  context_->refusals.note(input_->user(), why);
  lost(-ECONNRESET);
}

}  // namespace qv::platform::sdbus
