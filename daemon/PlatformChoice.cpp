#include "daemon/PlatformChoice.h"

#include <cstdlib>

#include "platform/Log.h"
#include "platform/ffmpeg/MoviesLoader.h"
#include "platform/headless/HeadlessPlatform.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/pulse/PulsePlatform.h"
#include "platform/sdbus/SdBusIPC.h"
#include "platform/sdbus/SdBusKeepAlive.h"
#include "platform/x11/X11Platform.h"

namespace qv {

namespace logs = platform::logs;

struct PlatformChoice::Backends {
  platform::LinuxPlatform linux{platform::deviceRootFromEnvironment(), platform::bundlePathFromEnvironment()};
  platform::SdBusIPCService ipc{linux.peerResolver()};
  platform::SdBusKeepAlive keepAlive;
  platform::ffmpeg::MoviesLoader movies;
  platform::HeadlessPlatform headless{platform::HeadlessOptions{}};
  std::unique_ptr<platform::X11Platform> x11;
  std::unique_ptr<platform::PulsePlatform> pulse;
};

PlatformChoice::PlatformChoice() : backends_(std::make_unique<Backends>()) {
  backends_->linux.addTo(platform_);
  platform_.ipc = &backends_->ipc;
  platform_.keepAlive = &backends_->keepAlive;
  platform_.assetWriter = &backends_->movies;
  platform_.exportService = &backends_->movies;
  chooseScreen();
  chooseSound();
}

PlatformChoice::~PlatformChoice() = default;

void PlatformChoice::chooseScreen() {
  platform::X11Dependencies dependencies;
  dependencies.bundleIdentifierOfProcess = [bundles = platform_.bundles](pid_t pid) -> std::optional<std::string> {
    const auto executable = bundles->executablePathOfProcess(pid);
    const auto bundle = executable ? bundles->bundleEnclosingExecutable(*executable) : nullptr;
    if (!bundle || bundle->bundleIdentifier().empty()) return std::nullopt;
    return bundle->bundleIdentifier();
  };
  const char* display = std::getenv("DISPLAY");
  if (display != nullptr && *display != '\0') {
    auto connected = platform::X11Platform::connect({}, std::move(dependencies));
    if (connected) {
      backends_->x11 = std::move(*connected);
    } else {
      QV_LOG_ERROR(logs::kPlatform, "display %s: %s", display, connected.error().description().c_str());
    }
  }
  if (backends_->x11) {
    platform_.screenCapture = &backends_->x11->screenCapture();
    platform_.applications = &backends_->x11->applications();
    platform_.renderServer = &backends_->x11->renderServer();
    platform_.userAlerts = &backends_->x11->alerts();
  } else {
    platform_.screenCapture = &backends_->headless.screenCapture();
    platform_.applications = &backends_->headless.applications();
    platform_.renderServer = &backends_->headless.renderServer();
    platform_.userAlerts = &backends_->headless.userAlerts();
  }
  QV_LOG(logs::kPlatform, "screen, applications and alerts: %s", backends_->x11 ? "X11" : "headless");
}

void PlatformChoice::chooseSound() {
  auto connected = platform::PulsePlatform::connect();
  if (connected) {
    backends_->pulse = std::move(*connected);
    platform_.appAudioTap = &backends_->pulse->appAudioTap();
    platform_.deviceCapture = &backends_->pulse->deviceCapture();
    platform_.sounds = &backends_->pulse->sounds();
    platform_.screenReader = &backends_->pulse->screenReader();
  } else {
    platform_.appAudioTap = &backends_->headless.appAudioTap();
    platform_.deviceCapture = &backends_->headless.deviceCapture();
    platform_.sounds = &backends_->headless.sounds();
    platform_.screenReader = &backends_->headless.screenReader();
  }
  QV_LOG(logs::kPlatform, "app audio, microphone and sounds: %s", backends_->pulse ? "PulseAudio" : "headless");
}

}  // namespace qv
