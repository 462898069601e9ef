#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "platform/Platform.h"
#include "tests/fakes/FakeBundles.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeDeviceInfo.h"
#include "tests/fakes/FakeExtensions.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FakeIPC.h"
#include "tests/fakes/FakeLocalization.h"
#include "tests/fakes/FakeMedia.h"
#include "tests/fakes/FakeMovieSalvage.h"
#include "tests/fakes/FakePreferences.h"
#include "tests/fakes/FakeServices.h"
#include "tests/fakes/FakeTimers.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ManualExecutor.h"

namespace qv::fakes {

inline constexpr const char kStore[] = "/private/var/mobile/Library/Quorvel";

/// A whole device of fakes, installed as the platform while it lives. Work waits until `run`.
struct FakeDevice {
  FakeDevice() {
    platform.clock = &clock;
    platform.timers = &timers;
    platform.globalQueue = &executor;
    platform.backgroundQueue = &executor;
    platform.mainQueue = &mainQueue;
    platform.ipc = &ipc;
    platform.keepAlive = &keepAlive;
    platform.screenCapture = &screen;
    platform.deviceCapture = &deviceCapture;
    platform.appAudioTap = &tap;
    platform.assetWriter = &movies;
    platform.exportService = &exports;
    platform.movieSalvage = &salvage;
    platform.applications = &applications;
    platform.renderServer = &applications;
    platform.userAlerts = &alerts;
    platform.sounds = &sounds;
    platform.screenReader = &sounds;
    platform.fileSystem = &disk;
    platform.bundles = &bundles;
    platform.localization = &localization;
    platform.preferences = &preferences;
    platform.deviceInfo = &deviceInfo;
    platform.purgeableSpace = &purgeableSpace;
    platform.photoLibrary = &photoLibrary;
    platform.metrics = &metrics;
    platform.extensions = &extensions;
    disk.addDirectory(kStore);
    disk.setFreeSize(1'000'000'000);
    platform::Platform::install(&platform);
  }
  ~FakeDevice() {
    run();
    platform::Platform::install(nullptr);
  }
  void run() { executor.runUntilIdle(); }

  LogRecorder log;
  ManualExecutor executor;
  platform::SerialQueue mainQueue{"main", executor};
  FakeClock clock;
  FakeTimers timers;
  FakeIPCService ipc{executor};
  FakeKeepAlive keepAlive;
  FakeScreenCapture screen;
  FakeDeviceCapture deviceCapture;
  FakeAppAudioTap tap;
  FakeAssetWriterService movies;
  FakeExportService exports;
  FakeMovieSalvage salvage;
  FakeApplications applications;
  FakeUserAlerts alerts;
  FakeSounds sounds;
  FakeFileSystem disk;
  FakeBundleService bundles;
  FakeLocalization localization;
  FakePreferences preferences;
  FakeDeviceInfo deviceInfo;
  FakePurgeableSpace purgeableSpace;
  FakePhotoLibrary photoLibrary;
  FakeMetrics metrics;
  FakeExtensionService extensions{executor};
  platform::Platform platform;
};

}  // namespace qv::fakes
