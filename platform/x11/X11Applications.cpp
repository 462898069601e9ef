#include "platform/x11/X11Applications.h"

#include <mutex>
#include <utility>

#include "platform/threads/SerialQueue.h"
#include "platform/x11/ApplicationWatch.h"

namespace qv::platform {
namespace {

std::vector<RunningApplication> runningApplications(QueryConnection& connection, const BundleLookup& bundleOfProcess) {
  const auto desktop = connection.ask<DesktopSnapshot>({}, [](XcbConnection& c) { return readDesktop(c, false); });
  return applicationsOf(desktop, bundleOfProcess);
}

/// The application's process that is in front, else the one with the topmost window.
std::optional<RunningApplication> findApplication(QueryConnection& connection, const BundleLookup& bundleOfProcess,
                                                  const std::string& bundleID) {
  std::optional<RunningApplication> found;
  for (auto& application : runningApplications(connection, bundleOfProcess))
    if (application.bundleID == bundleID && (!found || application.isFrontmost)) found = std::move(application);
  return found;
}

class X11ApplicationStateMonitor final : public ApplicationStateMonitor {
 public:
  X11ApplicationStateMonitor(std::shared_ptr<QueryConnection> connection, BundleLookup bundleOfProcess)
      : connection_(std::move(connection)), bundleOfProcess_(std::move(bundleOfProcess)) {}
  ~X11ApplicationStateMonitor() override { setHandler({}); }

  uint32_t applicationStateForBundleIdentifier(const std::string& bundleID) override {
    const auto application = findApplication(*connection_, bundleOfProcess_, bundleID);
    return application ? applicationStateOf(*application) : uint32_t{kApplicationUnknown};
  }

  void applicationInfoForBundleIdentifier(const std::string& bundleID,
                                          std::function<void(Dictionary)> handler) override {
    infoQueue_.async([connection = connection_, lookup = bundleOfProcess_, bundleID, handler = std::move(handler)] {
      const auto application = findApplication(*connection, lookup, bundleID);
      handler(application ? applicationReport(*application, applicationStateOf(*application)) : Dictionary{});
    });
  }

  void setHandler(std::function<void(const Dictionary&)> handler) override;

 private:
  const std::shared_ptr<QueryConnection> connection_;
  const BundleLookup bundleOfProcess_;
  SerialQueue infoQueue_{"com.tarnwick.quorveld.ApplicationInfoQueue"};
  std::mutex mutex_;
  std::shared_ptr<ApplicationWatch> watch_;  // guarded by mutex_
};

void X11ApplicationStateMonitor::setHandler(std::function<void(const Dictionary&)> handler) {
  std::shared_ptr<ApplicationWatch> watch;
  if (handler) {
    watch = std::make_shared<ApplicationWatch>(connection_->display(), bundleOfProcess_, std::move(handler));
    watch->begin();
  }
  {
    std::lock_guard lock(mutex_);
    watch_.swap(watch);
  }
  if (watch) ApplicationWatch::end(std::move(watch));
}

}  // namespace

X11ApplicationService::X11ApplicationService(std::shared_ptr<QueryConnection> connection, BundleLookup bundleOfProcess)
    : connection_(std::move(connection)), bundleOfProcess_(std::move(bundleOfProcess)) {}

std::unique_ptr<ApplicationStateMonitor> X11ApplicationService::createStateMonitor() {
  return std::make_unique<X11ApplicationStateMonitor>(connection_, bundleOfProcess_);
}

std::optional<std::string> X11ApplicationService::frontmostApplication() {
  for (auto& application : runningApplications(*connection_, bundleOfProcess_))
    if (application.isFrontmost) return std::move(application.bundleID);
  return std::nullopt;
}

}  // namespace qv::platform
