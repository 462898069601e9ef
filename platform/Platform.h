#pragma once

#include <cstdint>
#include <string>

#include "platform/AppAudioTap.h"
#include "platform/Applications.h"
#include "platform/AssetWriter.h"
#include "platform/Bundles.h"
#include "platform/DeviceCapture.h"
#include "platform/DeviceInfo.h"
#include "platform/DeviceServices.h"
#include "platform/Entitlements.h"
#include "platform/ExportSession.h"
#include "platform/Extensions.h"
#include "platform/FileSystem.h"
#include "platform/IPC.h"
#include "platform/KeepAlive.h"
#include "platform/Localization.h"
#include "platform/Metrics.h"
#include "platform/MovieSalvage.h"
#include "platform/NetworkReachability.h"
#include "platform/PhotoLibrary.h"
#include "platform/Preferences.h"
#include "platform/PurgeableSpace.h"
#include "platform/RenderServer.h"
#include "platform/ScreenCapture.h"
#include "platform/ScreenReader.h"
#include "platform/Sounds.h"
#include "platform/StatusBar.h"
#include "platform/StoreLookup.h"
#include "platform/UserAlert.h"
#include "platform/threads/Clock.h"
#include "platform/threads/Executor.h"
#include "platform/threads/RunLoop.h"
#include "platform/threads/Timer.h"

namespace qv::platform {

/// The services of this process, gathered. The process entry (or a test) builds one, installs it
/// before anything else runs, and keeps it until everything else has ended. The pointers are
/// borrowed; none is null in a daemon, a test sets those that it needs.
struct Platform {
  Clock* clock = &systemClock();
  TimerService* timers = &systemTimers();
  Executor* globalQueue = &qv::platform::globalQueue();
  Executor* backgroundQueue = &qv::platform::globalBackgroundQueue();
  SerialQueue* mainQueue = &qv::platform::mainQueue();
  /// What stands before every absolute path of the system; empty on a device. No trailing "/".
  std::string deviceRoot;

  IPCService* ipc = nullptr;
  KeepAliveService* keepAlive = nullptr;
  ScreenCaptureService* screenCapture = nullptr;
  DeviceCaptureService* deviceCapture = nullptr;
  AppAudioTapService* appAudioTap = nullptr;
  AssetWriterService* assetWriter = nullptr;
  ExportService* exportService = nullptr;
  MovieSalvage* movieSalvage = nullptr;
  ApplicationService* applications = nullptr;
  RenderServer* renderServer = nullptr;
  UserAlertService* userAlerts = nullptr;
  StatusBarOverrideCoordinator* statusBar = nullptr;
  SystemSounds* sounds = nullptr;
  ScreenReader* screenReader = nullptr;
  FileSystem* fileSystem = nullptr;
  BundleService* bundles = nullptr;
  Localization* localization = nullptr;
  PreferenceStore* preferences = nullptr;
  DeviceInfoQuery* deviceInfo = nullptr;
  PurgeableSpaceService* purgeableSpace = nullptr;
  PhotoLibrary* photoLibrary = nullptr;
  MetricsReporter* metrics = nullptr;
  ExtensionService* extensions = nullptr;
  StoreLookupService* storeLookup = nullptr;
  NetworkReachabilityService* reachability = nullptr;
  EntitlementQuery* entitlements = nullptr;
  DeviceServicesQuery* services = nullptr;
};

}  // namespace qv::platform
