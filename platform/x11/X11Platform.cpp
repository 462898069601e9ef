#include "platform/x11/X11Platform.h"

#include <cstdlib>

#include "platform/x11/X11Applications.h"
#include "platform/x11/X11DisplayLayoutMonitor.h"
#include "platform/x11/X11RenderServer.h"
#include "platform/x11/X11ScreenCapture.h"
#include "platform/x11/X11StatusBar.h"
#include "platform/x11/X11UserAlert.h"

namespace qv::platform {
namespace {

/// The name is fixed here, so that a later change of the environment changes nothing.
std::string resolvedDisplay(const std::string& display) {
  if (!display.empty()) return display;
  const char* environment = std::getenv("DISPLAY");
  return environment == nullptr ? "" : environment;
}

}  // namespace

struct X11Platform::Services {
  Services(const std::string& display, X11Dependencies dependencies)
      : queries(std::make_shared<QueryConnection>(display)),
        screenCapture(display, *dependencies.clock),
        bundleOfProcess(std::move(dependencies.bundleIdentifierOfProcess)),
        applications(queries, bundleOfProcess),
        alerts(display),
        statusBar(display, dependencies.moduleDirectory) {}

  const std::shared_ptr<QueryConnection> queries;
  X11ScreenCaptureService screenCapture;
  const BundleLookup bundleOfProcess;
  X11ApplicationService applications;
  X11RenderServer renderServer{*queries};
  X11UserAlertService alerts;
  X11StatusBar statusBar;
};

Result<std::unique_ptr<X11Platform>> X11Platform::connect(const std::string& display, X11Dependencies dependencies) {
  auto services = std::make_unique<Services>(resolvedDisplay(display), std::move(dependencies));
  if (auto failure = services->queries->connect()) return *failure;
  return std::unique_ptr<X11Platform>(new X11Platform(std::move(services)));
}

X11Platform::X11Platform(std::unique_ptr<Services> services) : services_(std::move(services)) {}
X11Platform::~X11Platform() = default;

ScreenCaptureService& X11Platform::screenCapture() { return services_->screenCapture; }
ApplicationService& X11Platform::applications() { return services_->applications; }
RenderServer& X11Platform::renderServer() { return services_->renderServer; }
UserAlertService& X11Platform::alerts() { return services_->alerts; }
StatusBarOverrideCoordinator& X11Platform::statusBar() { return services_->statusBar; }
std::optional<Error> X11Platform::whyNotThere() const {
  return QueryConnection(services_->queries->display()).connect();
}

std::shared_ptr<DisplayLayoutMonitor> X11Platform::createLayoutMonitor() {
  return std::make_shared<X11DisplayLayoutMonitor>(services_->queries->display(), services_->bundleOfProcess);
}

}  // namespace qv::platform
