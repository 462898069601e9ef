#include "platform/x11/X11DisplayLayoutMonitor.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"

namespace qv::platform {
namespace {
constexpr std::chrono::milliseconds kReconnectInterval{1000};
constexpr std::chrono::milliseconds kReplyLimit{2000};
}  // namespace

X11DisplayLayoutMonitor::X11DisplayLayoutMonitor(std::string display, BundleLookup bundleOfProcess)
    : display_(std::move(display)),
      bundleOfProcess_(std::move(bundleOfProcess)),
      event_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

X11DisplayLayoutMonitor::~X11DisplayLayoutMonitor() {
  {
    std::lock_guard lock(mutex_);
    isEnding_ = true;
  }
  wake();
  if (thread_.joinable()) thread_.join();
}

void X11DisplayLayoutMonitor::addObserver(std::weak_ptr<DisplayLayoutObserver> observer) {
  const auto strong = observer.lock();
  std::lock_guard lock(mutex_);
  if (!strong || isInvalid_) return;
  const auto known = [&](const auto& entry) { return entry.first == strong.get(); };
  if (std::any_of(observers_.begin(), observers_.end(), known)) return;
  isFresh_ = isFresh_ || observers_.empty();
  observers_.emplace_back(strong.get(), std::move(observer));
  if (!thread_.joinable()) thread_ = std::thread([this] { run(); });
  wake();
}

void X11DisplayLayoutMonitor::removeObserver(const DisplayLayoutObserver* observer) {
  std::lock_guard lock(mutex_);
  std::erase_if(observers_, [observer](const auto& entry) { return entry.first == observer; });
  wake();
}

void X11DisplayLayoutMonitor::invalidate() {
  std::lock_guard lock(mutex_);
  isInvalid_ = true;
  observers_.clear();
  wake();
}

void X11DisplayLayoutMonitor::wake() { ::eventfd_write(event_.get(), 1); }

void X11DisplayLayoutMonitor::run() {
  const ScopedSigpipeBlock noSigpipe;
  for (;;) {
    bool isObserved = false;
    {
      std::lock_guard lock(mutex_);
      if (isEnding_) return;
      isObserved = !observers_.empty();
      // A new time of observation has its own layout to begin with.
      if (!isObserved || std::exchange(isFresh_, false)) connection_.reset();
    }
    if (isObserved) {
      watchOnce();
    } else {
      sleep(false, std::nullopt);
    }
  }
}

void X11DisplayLayoutMonitor::watchOnce() {
  if (!connection_ && !connect()) {
    sleep(false, std::chrono::steady_clock::now() + kReconnectInterval);
    return;
  }
  if (lookAt_ && std::chrono::steady_clock::now() >= *lookAt_) look();
  // After the look: an event that came in beside its replies does not wake the poll any more.
  if (!lookAt_ && drainEvents()) lookAt_ = std::chrono::steady_clock::now() + kSettling;
  if (connection_->isLost()) {
    QV_LOG_INFO(logs::kPlatform, "display layout: the X server has gone");
    connection_.reset();
    return;
  }
  sleep(!lookAt_, lookAt_);
}

bool X11DisplayLayoutMonitor::connect() {
  lookAt_.reset();
  settling_.reset();
  auto opened = XcbConnection::open(display_, kReplyLimit);
  if (!opened) return false;
  connection_ = std::move(opened.value());
  const uint32_t mask = XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY | XCB_EVENT_MASK_PROPERTY_CHANGE;
  xcb_change_window_attributes(connection_->get(), connection_->root(), XCB_CW_EVENT_MASK, &mask);
  clientListAtom_ = connection_->atom("_NET_CLIENT_LIST_STACKING");
  reported_ = applicationCount(layoutOf(readShownWindows(*connection_, bundleOfProcess_)));
  if (connection_->isLost()) {
    connection_.reset();
    return false;
  }
  QV_LOG_INFO(logs::kPlatform, "display layout: observed, the screen is divided among %d", reported_);
  return true;
}

/// Whether one of the events may have changed the layout.
bool X11DisplayLayoutMonitor::drainEvents() {
  bool concerns = false;
  while (auto event = connection_->pollEvent()) {
    const int type = event->response_type & 0x7F;
    if (type == XCB_PROPERTY_NOTIFY) {
      concerns |= reinterpret_cast<const xcb_property_notify_event_t&>(*event).atom == clientListAtom_;
    } else {
      concerns |= type != XCB_CREATE_NOTIFY && type != 0;  // what was only created is not seen
    }
  }
  return concerns;
}

void X11DisplayLayoutMonitor::look() {
  lookAt_.reset();
  (void)drainEvents();  // what they tell is read now
  const auto layout = layoutOf(readShownWindows(*connection_, bundleOfProcess_));
  if (connection_->isLost()) return;
  const int count = applicationCount(layout);
  if (count == reported_) {
    settling_.reset();
  } else if (settling_ != count) {
    settling_ = count;
    lookAt_ = std::chrono::steady_clock::now() + kSettling;
  } else {
    settling_.reset();
    reported_ = count;
    QV_LOG_INFO(logs::kPlatform, "display layout: the screen is divided among %d", count);
    report(layout);
  }
}

void X11DisplayLayoutMonitor::report(const DisplayLayout& layout) {
  decltype(observers_) observers;
  {
    std::lock_guard lock(mutex_);
    observers = observers_;
  }
  for (const auto& [address, weak] : observers)
    if (const auto observer = weak.lock()) observer->layoutMonitorDidUpdateDisplayLayout(*this, layout);
}

void X11DisplayLayoutMonitor::sleep(bool alsoForEvents, std::optional<Time> until) {
  pollfd descriptors[2] = {{event_.get(), POLLIN, 0}, {-1, POLLIN, 0}};
  if (connection_) xcb_flush(connection_->get());
  if (connection_ && alsoForEvents) descriptors[1].fd = connection_->fd();
  int timeout = -1;
  if (until) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*until - std::chrono::steady_clock::now());
    timeout = std::max(0, static_cast<int>(left.count()));
  }
  ::poll(descriptors, 2, timeout);
  eventfd_t ignored = 0;
  ::eventfd_read(event_.get(), &ignored);
}

}  // namespace qv::platform
