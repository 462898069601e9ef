#include "platform/x11/ApplicationWatch.h"

#include <poll.h>
#include <sys/epoll.h>
#include <sys/syscall.h>

#include <algorithm>
#include <future>
#include <utility>

#include "platform/Applications.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr std::chrono::milliseconds kCoalescing{50};

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
                                   std::function<void(const Dictionary&)> handler)
    : bundleOfProcess_(std::move(bundleOfProcess)),
      handler_(std::move(handler)),
      desktop_(loop_, *this, std::move(display), kCoalescing) {}

void ApplicationWatch::begin() {
  std::promise<void> begun;
  loop_.post([this, &begun] {
    desktop_.begin();
    hasBegun_ = true;
    begun.set_value();
  });
  begun.get_future().wait();
}

void ApplicationWatch::end(std::shared_ptr<ApplicationWatch> watch) {
  watch->gate_.close();
  if (!watch->loop_.isCurrent()) return;
  EventLoop& loop = watch->loop_;
  loop.post([watch = std::move(watch)] {});
}

void ApplicationWatch::desktopConnected(XcbConnection& connection) {
  const uint32_t mask =
      XCB_EVENT_MASK_SUBSTRUCTURE_NOTIFY | XCB_EVENT_MASK_PROPERTY_CHANGE | XCB_EVENT_MASK_FOCUS_CHANGE;
  xcb_change_window_attributes(connection.get(), connection.root(), XCB_CW_EVENT_MASK, &mask);
  activeWindowAtom_ = connection.atom("_NET_ACTIVE_WINDOW");
  managerAtom_ = connection.atom("_NET_SUPPORTING_WM_CHECK");
  clientListAtom_ = connection.atom("_NET_CLIENT_LIST_STACKING");
  if (hasBegun_) return desktop_.lookIn(kCoalescing);
  const auto desktop = readDesktop(connection, true);
  hasWindowManager_ = desktop.hasWindowManager;
  std::vector<Dictionary> unreported;
  learn(applicationsOf(desktop, bundleOfProcess_), unreported, unreported);
}

bool ApplicationWatch::desktopEventConcerns(const xcb_generic_event_t& event) {
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

void ApplicationWatch::lookAtDesktop(XcbConnection& connection) {
  auto desktop = readDesktop(connection, true);
  if (connection.isLost()) desktop = {};
  hasWindowManager_ = desktop.hasWindowManager;
  reportChanges(desktop);
}

void ApplicationWatch::desktopWasLost() {
  QV_LOG_INFO(logs::kPlatform, "application states: the X server has gone");
  reportChanges({});
}

void ApplicationWatch::processEnded() {
  if (desktop_.isConnected()) {
    desktop_.lookIn(std::chrono::milliseconds(0));
  } else {
    reportChanges({});
  }
}

void ApplicationWatch::reportChanges(const DesktopSnapshot& desktop) {
  std::vector<Dictionary> losses, gains;
  learn(applicationsOf(desktop, bundleOfProcess_), losses, gains);
  if (report(losses)) report(gains);
}

void ApplicationWatch::learn(std::vector<RunningApplication> present, std::vector<Dictionary>& losses,
                             std::vector<Dictionary>& gains) {
  for (auto known = known_.begin(); known != known_.end();) {
    auto& [application, process, ended, state] = known->second;
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
    auto ended = loop_.watch(process.get(), EPOLLIN, [this](uint32_t) { processEnded(); });
    known_[application.pid] = {application, std::move(process), std::move(ended), state};
  }
}

/// False when the watch was ended.
bool ApplicationWatch::report(const std::vector<Dictionary>& reports) {
  return std::ranges::all_of(reports, [this](const Dictionary& one) { return gate_.enter([&] { handler_(one); }); });
}

}  // namespace qv::platform
