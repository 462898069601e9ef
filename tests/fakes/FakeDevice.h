#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "platform/Platform.h"
#include "support/QVBundleTexts.h"
#include "support/QVTemporaryFiles.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeDeviceInfo.h"
#include "tests/fakes/FakeExtensions.h"
#include "tests/fakes/FakeIPC.h"
#include "tests/fakes/FakeMovieSalvage.h"
#include "tests/fakes/FakeMovies.h"
#include "tests/fakes/FakeScreen.h"
#include "tests/fakes/FakeServices.h"
#include "tests/fakes/FakeSound.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ManualExecutor.h"
#include "tests/fakes/ManualTimers.h"
#include "tests/fakes/ScratchBundles.h"
#include "tests/fakes/ScratchDisk.h"
#include "tests/fakes/ScratchPreferences.h"

namespace qv::fakes {

inline constexpr const char kStore[] = "/private/var/mobile/Library/Quorvel";

/// A whole device of fakes. Work waits until `run`.
struct FakeDevice {
  FakeDevice();
  ~FakeDevice();
  FakeDevice(const FakeDevice&) = delete;
  FakeDevice& operator=(const FakeDevice&) = delete;
  void run() { executor.runUntilIdle(); }

  LogRecorder log;
  ManualExecutor executor;
  platform::SerialQueue mainQueue{"main", executor};
  FakeClock clock;
  ManualTimers timers;
  FakeIPCService ipc{executor};
  FakeKeepAlive keepAlive;
  FakeScreenCapture screen;
  FakeDeviceCapture deviceCapture;
  FakeAppAudioTap tap;
  ScratchDisk disk;
  FakeAssetWriterService movies{disk, clock};
  FakeExportService exports{disk, clock};
  FakeMovieSalvage salvage;
  FakeApplications applications;
  FakeUserAlerts alerts;
  FakeStatusBar statusBar;
  FakeSounds sounds;
  ScratchPreferences preferences{disk.at("/private/var/mobile/Library/Preferences")};
  ScratchBundles bundles{disk, "", preferences.localization};
  FakeDeviceInfo deviceInfo;
  FakePurgeableSpace purgeableSpace;
  FakePhotoLibrary photoLibrary{disk};
  FakeMetrics metrics;
  FakeExtensionService extensions{executor};
  FakeDeviceServices services;
  FakeEntitlements entitlements;
  platform::Platform platform;
  QVTemporaryFiles files{platform};
  QVBundleTexts texts{platform};
};

}  // namespace qv::fakes
