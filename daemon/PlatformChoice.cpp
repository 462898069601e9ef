#include "daemon/PlatformChoice.h"

#include <cstdlib>

#include "daemon/ChosenServices.h"
#include "daemon/SoundChoice.h"
#include "platform/appstream/AppStreamStore.h"
#include "platform/ffmpeg/MoviesLoader.h"
#include "platform/headless/HeadlessPlatform.h"
#include "platform/linux/DeviceRoot.h"
#include "platform/linux/LinuxExtensionService.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/linux/LocalExtensionStarter.h"
#include "platform/linux/RemoteExtensionStarter.h"
#include "platform/linux/SessionUser.h"
#include "platform/logind/LogindKeepAlive.h"
#include "platform/mp4/MP4MovieSalvage.h"
#include "platform/sdbus/SdBusIPC.h"
#include "platform/threads/Log.h"
#include "platform/x11/X11Platform.h"
#include "support/QVDeviceLayout.h"
#include "support/QVDiskSpace.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

namespace logs = platform::logs;

namespace {

/// The screen readers that free desktops have. While one runs, a system recording is heard to begin and end.
const std::set<std::string> kScreenReaders{"orca"};

/// Its socket, where extensions are started by a service of its own; else empty, and the daemon starts them itself.
std::string extensionService() {
  const char* socket = ::secure_getenv("QUORVEL_EXTENSION_SERVICE");
  return socket != nullptr ? socket : "";
}

platform::LinuxDevice thisDevice() {
  platform::LinuxDevice device{.root = platform::deviceRootFromEnvironment(),
                               .bundlePath = platform::bundlePathFromEnvironment(),
                               .preferences = kPreferencesDirectory,
                               .preferenceDomain = kPreferenceDomain,
                               .photoLibrary = kPhotoLibraryDirectory,
                               .metrics = kMetricsDirectory,
                               .screenReaders = kScreenReaders,
                               .watchedPath = kTempPath,
                               .watchedSpace = {.thresholds = {kMinimumFreeSpaceForRecording,
                                                               kMinimumFreeSpaceWhileRecording, kCriticalFreeSpace},
                                                .criticalFor = kCriticalFor},
                               .sessionUser = platform::sessionUserFromEnvironment()};
  // Who starts no extensions has no network.
  if (const std::string socket = extensionService(); !socket.empty()) {
    device.reachabilityOfHost = [socket](const std::string& host) {
      return platform::remoteReachabilityOfHost(socket, host);
    };
  }
  return device;
}

/// Anybody who may connect is a peer that is not trusted, and so is every extension.
platform::SdBusIPCOptions messaging() {
  platform::SdBusIPCOptions options;
  options.trustsPeers = false;
  if (const char* group = ::secure_getenv("QUORVEL_SOCKET_GROUP")) options.socketGroup = group;
  return options;
}

std::unique_ptr<platform::ExtensionStarter> extensionStarter() {
  if (std::string socket = extensionService(); !socket.empty()) {
    return std::make_unique<platform::RemoteExtensionStarter>(std::move(socket));
  }
  return std::make_unique<platform::LocalExtensionStarter>(
      platform::ExtensionLaunchOptions{.dataDirectory = platform::deviceRootFromEnvironment() + kDataDirectory,
                                       .launcherPath = platform::installedExtensionLauncher()});
}

}  // namespace

struct PlatformChoice::Backends {
  platform::LinuxPlatform linux{thisDevice()};
  platform::SdBusIPCService ipc{linux.peerResolver(), messaging()};
  platform::LinuxExtensionService extensions{ipc, linux.bundles(), platform::systemTimers(), platform::globalQueue(),
                                             extensionStarter()};
  // What is recorded may fill the disk, and nothing else of the daemon does.
  platform::LogindKeepAlive keepAlive{
      {.busAddress = {}, .activityHandler = [this](bool isOpen) { linux.watchFreeSpace(isOpen); }}};
  platform::ffmpeg::MoviesLoader movies;
  platform::mp4::MP4MovieSalvage movieSalvage;
  std::unique_ptr<platform::appstream::AppStreamStore> store;
  platform::HeadlessPlatform headless{platform::HeadlessOptions{}};
  SoundChoice sound{headless};
  std::unique_ptr<platform::X11Platform> x11;
  ChosenServices services{sound, movies};
  std::shared_ptr<platform::DisplayLayoutMonitor> layoutMonitor;
};

PlatformChoice::PlatformChoice() : backends_(std::make_unique<Backends>()) {
  backends_->linux.addTo(platform_);
  platform_.ipc = &backends_->ipc;
  platform_.extensions = &backends_->extensions;
  platform_.keepAlive = &backends_->keepAlive;
  platform_.assetWriter = &backends_->movies;
  platform_.exportService = &backends_->movies;
  platform_.movieSalvage = &backends_->movieSalvage;
  backends_->store = std::make_unique<platform::appstream::AppStreamStore>(
      platform_.deviceRoot, *platform_.localization, platform::globalQueue());
  platform_.storeLookup = backends_->store.get();
  chooseScreen();
  chooseSound();
}

PlatformChoice::~PlatformChoice() = default;

platform::SuspendMonitor& PlatformChoice::suspendMonitor() { return backends_->keepAlive; }
std::shared_ptr<platform::DisplayLayoutMonitor> PlatformChoice::layoutMonitor() { return backends_->layoutMonitor; }

void PlatformChoice::chooseScreen() {
  platform::X11Dependencies dependencies;
  dependencies.bundleIdentifierOfProcess = [bundles = platform_.bundles](pid_t pid) -> std::optional<std::string> {
    const auto executable = bundles->executablePathOfProcess(pid);
    const auto bundle = executable ? bundles->bundleEnclosingExecutable(*executable) : nullptr;
    if (!bundle || bundle->bundleIdentifier().empty()) return std::nullopt;
    return bundle->bundleIdentifier();
  };
  std::optional<platform::Error> fault;
  const char* display = std::getenv("DISPLAY");
  if (display != nullptr && *display != '\0') {
    auto connected = platform::X11Platform::connect({}, std::move(dependencies));
    if (connected) {
      backends_->x11 = std::move(*connected);
    } else {
      fault = connected.error();
      QV_LOG_ERROR(logs::kPlatform, "display %s: %s", display, fault->description().c_str());
    }
  }
  if (backends_->x11) {
    platform_.screenCapture = &backends_->x11->screenCapture();
    platform_.applications = &backends_->x11->applications();
    platform_.renderServer = &backends_->x11->renderServer();
    platform_.userAlerts = &backends_->x11->alerts();
    platform_.statusBar = &backends_->x11->statusBar();
    backends_->layoutMonitor = backends_->x11->createLayoutMonitor();
  } else {
    platform_.screenCapture = &backends_->headless.screenCapture();
    platform_.applications = &backends_->headless.applications();
    platform_.renderServer = &backends_->headless.renderServer();
    platform_.userAlerts = &backends_->headless.userAlerts();
    platform_.statusBar = &backends_->headless.statusBar();
  }
  backends_->services.setDisplay(backends_->x11.get(), std::move(fault));
  platform_.services = &backends_->services;
  QV_LOG(logs::kPlatform, "screen, applications and alerts: %s", backends_->x11 ? "X11" : "headless");
}

void PlatformChoice::chooseSound() {
  platform_.appAudioTap = &backends_->sound;
  platform_.deviceCapture = &backends_->sound;
  platform_.sounds = &backends_->sound;
}

}  // namespace qv
