#include "platform/linux/LinuxPlatform.h"

#include <utility>

#include "platform/linux/OwnedFiles.h"
#include "platform/linux/ProcessIdentity.h"
#include "platform/threads/Log.h"

namespace qv::platform {

LinuxPlatform::LinuxPlatform(const LinuxDevice& device)
    : deviceRoot_(device.root),
      watchedPath_(deviceRoot_ + device.watchedPath),
      preferences_(deviceRoot_ + device.preferences),
      localization_(preferences_, device.preferenceDomain),
      bundles_(deviceRoot_, device.bundlePath, localization_),
      deviceInfo_(deviceRoot_),
      entitlements_(deviceRoot_, device.sessionUser),
      purgeableSpace_(systemTimers(), globalBackgroundQueue(), device.watchedSpace,
                      [this] { return watchedFreeSpace(); }),
      photoLibrary_(deviceRoot_ + device.photoLibrary, device.sessionUser, globalQueue()),
      metrics_(deviceRoot_ + device.metrics, systemClock()),
      reachability_(globalQueue(), RouteReachabilityService::kPatience, device.reachabilityOfHost),
      screenReader_(device.screenReaders) {}

void LinuxPlatform::addTo(Platform& platform) {
  platform.deviceRoot = deviceRoot_;
  platform.fileSystem = &fileSystem_;
  platform.preferences = &preferences_;
  platform.localization = &localization_;
  platform.bundles = &bundles_;
  platform.deviceInfo = &deviceInfo_;
  platform.purgeableSpace = &purgeableSpace_;
  platform.photoLibrary = &photoLibrary_;
  platform.metrics = &metrics_;
  platform.reachability = &reachability_;
  platform.screenReader = &screenReader_;
  platform.entitlements = &entitlements_;
}

std::optional<uint64_t> LinuxPlatform::watchedFreeSpace() {
  const auto bytes = fileSystem_.freeSizeOfFileSystem(watchedPath_);
  return bytes ? std::optional(bytes.value()) : std::nullopt;
}

IPCPeerResolver LinuxPlatform::peerResolver() {
  return [this](IPCPeer& peer) { resolve(peer); };
}

void LinuxPlatform::resolve(IPCPeer& peer) {
  const auto identity = ProcessIdentity::of(peer.processIdentifier, peer.processHandle, bundles_);
  if (!identity) return;
  peer.bundleIdentifier = identity->bundleIdentifier();
  peer.entitlements = entitlements_.entitlementsForBundle(*peer.bundleIdentifier, peer.userIdentifier);
  peer.identity = identity;
  if (peer.entitlements.empty()) return;
  const std::string foreign = whatOthersCanWrite(identity->executable());
  if (foreign.empty()) return;
  QV_LOG_ERROR(logs::kPlatform, "entitlements of %s are ignored: others than root could have written %s",
               peer.bundleIdentifier->c_str(), foreign.c_str());
  peer.entitlements.clear();
}

}  // namespace qv::platform
