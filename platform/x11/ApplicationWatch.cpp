#include "platform/x11/ApplicationWatch.h"

#include <poll.h>
#include <sys/syscall.h>

#include <algorithm>

#include "platform/Applications.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr std::chrono::milliseconds kCoalescing{50};
constexpr std::chrono::milliseconds kReconnectInterval{1000};
constexpr std::chrono::milliseconds kReplyLimit{2000};

FileDescriptor openProcess(pid_t pid) { return FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0))); }

bool hasEnded(const FileDescriptor& process) {
  pollfd readable{process.get(), POLLIN, 0};
  return ::poll(&readable, 1, 0) > 0;
}

}  // namespace

uint32_t applicationStateOf(const RunningApplication& application) {
  return application.isFrontmost ? kApplicationForeground : kApplicationBackground;
}

Dictionary applicationReport(const RunningApplication& application, uint32_t state) {
  return {{applicationstate::kStateKey, state},
          {applicationstate::kProcessIDKey, static_cast<int32_t>(application.pid)},
          {applicationstate::kIsFrontmostKey, application.isFrontmost},
          {applicationstate::kBundleIDKey, application.bundleID}};
}

ApplicationWatch::ApplicationWatch(std::string display, BundleLookup bundleOfProcess,
                                   std::function<void(const Dictionary&)> handler, int stopFd)
    : display_(std::move(display)),
      bundleOfProcess_(std::move(bundleOfProcess)),
      handler_(std::move(handler)),
      stopFd_(stopFd) {}

void ApplicationWatch::begin() {
  connect();
  std::vector<Dictionary> unreported;
  if (connection_) {
    const auto desktop = readDesktop(*connection_, true);
    hasWindowManager_ = desktop.hasWindowManager;
    learn(applicationsOf(desktop, bundleOfProcess_), unreported, unreported);
  }
}

void ApplicationWatch::connect() {
  auto opened = XcbConnection::open(display_, kReplyLimit);
  if (!opened) return;
  connection_ = std::move(opened.value());
  const uint32_t mask =
      XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY | XCB_EVENT_MASK_PROPERTY_CHANGE | XCB_EVENT_MASK_FOCUS_CHANGE;
  xcb_change_window_attributes(connection_->get(), connection_->root(), XCB_CW_EVENT_MASK, &mask);
  activeWindowAtom_ = connection_->atom("_NET_ACTIVE_WINDOW");
  managerAtom_ = connection_->atom("_NET_SUPPORTING_WM_CHECK");
  clientListAtom_ = connection_->atom("_NET_CLIENT_LIST_STACKING");
}

void ApplicationWatch::run() {
  while (!isStopped()) {
    if (!connection_) {
      connect();
      if (connection_) lookSoon();
    }
    if (connection_ && !lookAt_) handleEvents();
    if (connection_ && connection_->isLost()) {
      QV_LOG_INFO(logs::kPlatform, "application states: the X server has gone");
      connection_.reset();
      look();
    }
    for (const auto& [pid, known] : known_)
      if (hasEnded(known.process)) lookAt_ = Clock::now();
    if (lookAt_ && Clock::now() >= *lookAt_) {
      look();
      continue;
    }
    if (!sleep()) return;
  }
}

void ApplicationWatch::handleEvents() {
  while (auto event = connection_->pollEvent())
    if (concerns(*event)) lookSoon();
}

bool ApplicationWatch::concerns(const xcb_generic_event_t& event) const {
  switch (event.response_type & 0x7F) {
    case XCB_PROPERTY_NOTIFY: {
      const xcb_atom_t atom = reinterpret_cast<const xcb_property_notify_event_t&>(event).atom;
      return atom == activeWindowAtom_ || atom == managerAtom_ || atom == clientListAtom_;
    }
    case XCB_CONFIGURE_NOTIFY:  // the order of windows tells who is in front only where nobody manages them
    case XCB_CIRCULATE_NOTIFY:
      return !hasWindowManager_;
    case XCB_FOCUS_IN:
    case XCB_FOCUS_OUT:
    case XCB_CREATE_NOTIFY:
    case XCB_DESTROY_NOTIFY:
    case XCB_MAP_NOTIFY:
    case XCB_UNMAP_NOTIFY:
    case XCB_REPARENT_NOTIFY:
      return true;
    default:
      return false;
  }
}

void ApplicationWatch::lookSoon() {
  if (!lookAt_) lookAt_ = Clock::now() + kCoalescing;
}

void ApplicationWatch::look() {
  lookAt_.reset();
  DesktopSnapshot desktop;
  if (connection_) {
    while (connection_->pollEvent()) {  // what they tell is read now
    }
    desktop = readDesktop(*connection_, true);
    if (connection_->isLost()) desktop = {};
    hasWindowManager_ = desktop.hasWindowManager;
  }
  std::vector<Dictionary> losses, gains;
  learn(applicationsOf(desktop, bundleOfProcess_), losses, gains);
  if (report(losses)) report(gains);
}

void ApplicationWatch::learn(std::vector<RunningApplication> present, std::vector<Dictionary>& losses,
                             std::vector<Dictionary>& gains) {
  for (auto known = known_.begin(); known != known_.end();) {
    auto& [application, process, state] = known->second;
    application.isFrontmost = false;
    if (hasEnded(process)) {
      losses.push_back(applicationReport(application, kApplicationTerminated));
      std::erase_if(present, [pid = known->first](const auto& running) { return running.pid == pid; });
      known = known_.erase(known);
      continue;
    }
    // An application that shows no window any more still runs, in the background.
    auto running = std::find_if(present.begin(), present.end(), [&](const auto& p) { return p.pid == known->first; });
    if (running != present.end()) application = *running;
    if (const uint32_t now = applicationStateOf(application); now != state) {
      state = now;
      (application.isFrontmost ? gains : losses).push_back(applicationReport(application, state));
    }
    ++known;
  }
  for (auto& application : present) {
    if (known_.contains(application.pid)) continue;
    auto process = openProcess(application.pid);
    if (!process.isValid() || hasEnded(process)) continue;
    const uint32_t state = applicationStateOf(application);
    (application.isFrontmost ? gains : losses).push_back(applicationReport(application, state));
    known_[application.pid] = {application, std::move(process), state};
  }
}

bool ApplicationWatch::report(const std::vector<Dictionary>& reports) {
  for (const auto& dictionary : reports) {
    if (isStopped()) return false;
    handler_(dictionary);
  }
  return true;
}

bool ApplicationWatch::isStopped() const {
  pollfd readable{stopFd_, POLLIN, 0};
  return ::poll(&readable, 1, 0) > 0;
}

bool ApplicationWatch::sleep() {
  // While a look is due soon, further events do not wake the thread.
  std::vector<pollfd> descriptors{{stopFd_, POLLIN, 0}};
  for (const auto& [pid, known] : known_) descriptors.push_back({known.process.get(), POLLIN, 0});
  if (connection_) xcb_flush(connection_->get());
  if (connection_ && !lookAt_) descriptors.push_back({connection_->fd(), POLLIN, 0});
  int timeout = connection_ ? -1 : static_cast<int>(kReconnectInterval.count());
  if (lookAt_) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*lookAt_ - Clock::now());
    timeout = std::max(0, static_cast<int>(left.count()));
  }
  ::poll(descriptors.data(), descriptors.size(), timeout);
  return (descriptors.front().revents & POLLIN) == 0;
}

}  // namespace qv::platform
