#include "tests/fakes/FakeDevice.h"

namespace qv::fakes {

FakeDevice::FakeDevice() {
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
  salvage.others = platform::MovieState::Finished;
  platform.applications = &applications;
  platform.renderServer = &applications;
  platform.userAlerts = &alerts;
  platform.statusBar = &statusBar;
  platform.sounds = &sounds;
  platform.screenReader = &sounds;
  platform.fileSystem = &disk;
  platform.bundles = &bundles;
  platform.localization = &preferences.localization;
  platform.preferences = &preferences.store;
  platform.deviceInfo = &deviceInfo;
  platform.purgeableSpace = &purgeableSpace;
  platform.photoLibrary = &photoLibrary;
  platform.metrics = &metrics;
  platform.extensions = &extensions;
  platform.services = &services;
  platform.entitlements = &entitlements;
  disk.addDirectory(kStore);
  disk.setFreeSize(1'000'000'000);
}

FakeDevice::~FakeDevice() { run(); }

}  // namespace qv::fakes
