#include "platform/headless/HeadlessApplications.h"

#include <fstream>
#include <limits>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/threads/CallbackGate.h"
#include "platform/threads/Guarded.h"
#include "platform/threads/SerialQueue.h"

namespace qv::platform {
namespace {

/// Delivers reports to one handler.
///
/// Threading: thread-safe. Taking the handler away waits for a report in progress, except from within one.
class ReportGate {
 public:
  void setHandler(std::function<void(const Dictionary&)> handler) {
    handler_.store(std::move(handler));
    gate_.awaitIdle();
  }
  void report(const Dictionary& report) {
    gate_.enter([&] {
      if (const auto handler = handler_.load()) handler(report);
    });
  }

 private:
  CallbackGate gate_;
  Guarded<std::function<void(const Dictionary&)>> handler_;
};

}  // namespace

/// Threading: `mutex` guards what changes.
struct HeadlessApplications::State {
  Dictionary reportFor(const std::string& bundleID) const;

  ProcessLookup processOfBundle;
  mutable std::mutex mutex;
  std::optional<std::string> frontmost;
  std::vector<std::weak_ptr<ReportGate>> monitors;
  SerialQueue thread{"com.tarnwick.quorveld.applications"};
};

Dictionary HeadlessApplications::State::reportFor(const std::string& bundleID) const {
  if (bundleID.empty()) return {};
  Dictionary report;
  report[applicationstate::kStateKey] = uint32_t{kApplicationForeground};
  report[applicationstate::kBundleIDKey] = bundleID;
  if (const auto pid = processOfBundle ? processOfBundle(bundleID) : std::nullopt) {
    report[applicationstate::kProcessIDKey] = int32_t{*pid};
  }
  std::lock_guard lock(mutex);
  report[applicationstate::kIsFrontmostKey] = frontmost == bundleID;
  return report;
}

namespace {

/// Threading: as ApplicationStateMonitor.
class HeadlessMonitor final : public ApplicationStateMonitor {
 public:
  explicit HeadlessMonitor(std::shared_ptr<HeadlessApplications::State> state) : state_(std::move(state)) {
    std::lock_guard lock(state_->mutex);
    std::erase_if(state_->monitors, [](const auto& monitor) { return monitor.expired(); });
    state_->monitors.push_back(gate_);
  }
  ~HeadlessMonitor() override { gate_->setHandler(nullptr); }

  uint32_t applicationStateForBundleIdentifier(const std::string& bundleID) override {
    return bundleID.empty() ? kApplicationUnknown : kApplicationForeground;
  }
  void applicationInfoForBundleIdentifier(const std::string& bundleID,
                                          std::function<void(Dictionary)> handler) override {
    state_->thread.async(
        [state = state_, bundleID, handler = std::move(handler)] { handler(state->reportFor(bundleID)); });
  }
  void setHandler(std::function<void(const Dictionary&)> handler) override { gate_->setHandler(std::move(handler)); }

 private:
  const std::shared_ptr<HeadlessApplications::State> state_;
  const std::shared_ptr<ReportGate> gate_ = std::make_shared<ReportGate>();
};

bool isRunningProcess(pid_t pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  std::string line;
  while (std::getline(status, line)) {
    // A zombie runs no longer; a thread of another process is no process.
    if (line.starts_with("State:") && line.find_first_of("ZX", 6) < 10) return false;
    if (line.starts_with("Tgid:")) return std::stol(line.substr(5)) == pid;
  }
  return false;
}

}  // namespace

HeadlessApplications::HeadlessApplications(ProcessLookup processOfBundle, std::optional<std::string> frontmost)
    : state_(std::make_shared<State>()) {
  state_->processOfBundle = std::move(processOfBundle);
  state_->frontmost = std::move(frontmost);
}
HeadlessApplications::~HeadlessApplications() = default;

std::unique_ptr<ApplicationStateMonitor> HeadlessApplications::createStateMonitor() {
  return std::make_unique<HeadlessMonitor>(state_);
}

std::optional<std::string> HeadlessApplications::frontmostApplication() {
  std::lock_guard lock(state_->mutex);
  return state_->frontmost;
}

void HeadlessApplications::setFrontmostApplication(std::optional<std::string> bundleID) {
  std::lock_guard lock(state_->mutex);
  if (state_->frontmost == bundleID) return;
  const auto former = std::exchange(state_->frontmost, bundleID);
  state_->thread.async([state = state_, former, bundleID, monitors = state_->monitors] {
    for (const auto& changed : {former, bundleID}) {
      if (!changed) continue;
      const Dictionary report = state->reportFor(*changed);
      for (const auto& monitor : monitors) {
        if (const auto gate = monitor.lock()) gate->report(report);
      }
    }
  });
}

std::optional<pid_t> HeadlessRenderServer::ownerOfContext(uint32_t contextID) {
  if (contextID == 0 || contextID > uint32_t{std::numeric_limits<pid_t>::max()}) return std::nullopt;
  const auto pid = static_cast<pid_t>(contextID);
  if (!isRunningProcess(pid)) return std::nullopt;
  return pid;
}

}  // namespace qv::platform
