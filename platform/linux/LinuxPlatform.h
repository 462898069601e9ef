#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <set>
#include <string>

#include "platform/IPC.h"
#include "platform/Platform.h"
#include "platform/linux/DeviceDescription.h"
#include "platform/linux/EntitlementStore.h"
#include "platform/linux/FolderPhotoLibrary.h"
#include "platform/linux/FreeSpaceWatch.h"
#include "platform/linux/ICULocalization.h"
#include "platform/linux/JSONLineMetricsReporter.h"
#include "platform/linux/JSONPreferenceStore.h"
#include "platform/linux/LinuxBundleService.h"
#include "platform/linux/PosixFileSystem.h"
#include "platform/linux/ProcessScreenReader.h"
#include "platform/linux/RouteReachability.h"

namespace qv::platform {

/// Where things lie on the device. Directories without a separator at their end, under the root.
struct LinuxDevice {
  std::string root;        ///< as in Platform
  std::string bundlePath;  ///< as in LinuxBundleService; complete
  std::string preferences;
  std::string preferenceDomain;  ///< that names the languages
  std::string photoLibrary;
  std::string metrics;
  std::set<std::string> screenReaders{};  ///< names of their processes
  std::string watchedPath;                ///< on the disk whose free space is watched
  FreeSpaceLimits watchedSpace{};
  /// For whom entitlements hold that name nobody (EntitlementStore), and whose the photo library is, where this process
  /// is root.
  uid_t sessionUser = 0;
  HostReachability reachabilityOfHost = routeReachabilityOfHost;
};

/// The services that need nothing but Linux and files, for one device root. Making it reads nothing.
///
///   LinuxPlatform linux(device);
///   Platform platform;
///   linux.addTo(platform);
///   sdbus.setPeerResolver(linux.peerResolver());
///
/// Threading: make and destroy it in one thread, after everything that uses it; its services say for
/// themselves.
class LinuxPlatform {
 public:
  explicit LinuxPlatform(const LinuxDevice& device);
  LinuxPlatform(const LinuxPlatform&) = delete;
  LinuxPlatform& operator=(const LinuxPlatform&) = delete;

  /// Sets the device root, fileSystem, bundles, localization, preferences, deviceInfo,
  /// purgeableSpace, photoLibrary, metrics, reachability, screenReader and entitlements.
  void addTo(Platform& platform);
  /// Fills in a peer's bundle identifier, entitlements and identity. It borrows this object, as the identities do. A
  /// process that has ended, or whose executable lies in no bundle or was deleted, keeps none of them; one whose
  /// executable others than root and this process's user could have written keeps no entitlements.
  [[nodiscard]] IPCPeerResolver peerResolver();
  /// What the extension service searches.
  [[nodiscard]] LinuxBundleService& bundles() { return bundles_; }

  /// While files grow on the disk, its free space is watched.
  void watchFreeSpace(bool isOn) { purgeableSpace_.setActive(isOn); }

 private:
  [[nodiscard]] std::optional<uint64_t> watchedFreeSpace();
  void resolve(IPCPeer& peer);

  const std::string deviceRoot_;
  const std::string watchedPath_;  ///< complete
  PosixFileSystem fileSystem_;
  JSONPreferenceStore preferences_;
  ICULocalization localization_;
  LinuxBundleService bundles_;
  DeviceDescription deviceInfo_;
  EntitlementStore entitlements_;
  FreeSpaceWatch purgeableSpace_;
  FolderPhotoLibrary photoLibrary_;
  JSONLineMetricsReporter metrics_;
  RouteReachabilityService reachability_;
  ProcessScreenReader screenReader_;
};

}  // namespace qv::platform
