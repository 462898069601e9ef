#include "platform/x11/X11Platform.h"

#include <cstdlib>

#include "platform/x11/X11RenderServer.h"
#include "platform/x11/X11ScreenCapture.h"

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
      : queries(display), screenCapture(display, *dependencies.clock) {}

  QueryConnection queries;
  X11ScreenCaptureService screenCapture;
  X11RenderServer renderServer{queries};
};

Result<std::unique_ptr<X11Platform>> X11Platform::connect(const std::string& display, X11Dependencies dependencies) {
  auto services = std::make_unique<Services>(resolvedDisplay(display), std::move(dependencies));
  if (auto failure = services->queries.connect()) return *failure;
  return std::unique_ptr<X11Platform>(new X11Platform(std::move(services)));
}

X11Platform::X11Platform(std::unique_ptr<Services> services) : services_(std::move(services)) {}
X11Platform::~X11Platform() = default;

ScreenCaptureService& X11Platform::screenCapture() { return services_->screenCapture; }
RenderServer& X11Platform::renderServer() { return services_->renderServer; }

}  // namespace qv::platform
