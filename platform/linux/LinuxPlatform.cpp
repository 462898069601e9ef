#include "platform/linux/LinuxPlatform.h"

#include <poll.h>

#include <cstdlib>
#include <utility>

namespace qv::platform {
namespace {

std::string environment(const char* name) {
  const char* value = std::getenv(name);
  return value ? value : "";
}

/// Whether the pinned process still runs: a pidfd becomes readable when it ends.
bool isRunning(const SharedFileDescriptor& process) {
  if (!process) return false;
  pollfd state{process->get(), POLLIN, 0};
  return ::poll(&state, 1, 0) == 0;
}

}  // namespace

LinuxPlatform::LinuxPlatform(const LinuxDevice& device)
    : deviceRoot_(device.root),
      watchedPath_(deviceRoot_ + device.watchedPath),
      preferences_(deviceRoot_ + device.preferences),
      localization_(preferences_, device.preferenceDomain),
      bundles_(deviceRoot_, device.bundlePath, localization_),
      deviceInfo_(deviceRoot_),
      entitlements_(deviceRoot_),
      purgeableSpace_(systemTimers(), globalBackgroundQueue(), device.watchedSpace,
                      [this] { return watchedFreeSpace(); }),
      photoLibrary_(deviceRoot_ + device.photoLibrary, globalQueue()),
      metrics_(deviceRoot_ + device.metrics, systemClock()),
      reachability_(globalQueue()),
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
}

std::optional<uint64_t> LinuxPlatform::watchedFreeSpace() {
  const auto bytes = fileSystem_.freeSizeOfFileSystem(watchedPath_);
  return bytes ? std::optional(bytes.value()) : std::nullopt;
}

IPCPeerResolver LinuxPlatform::peerResolver() {
  return [this](IPCPeer& peer) { resolve(peer); };
}

void LinuxPlatform::resolve(IPCPeer& peer) {
  const auto executable = bundles_.executablePathOfProcess(peer.processIdentifier);
  // Looked at afterwards: while the pinned process still runs, the pid was its own all along.
  if (!executable || !isRunning(peer.processHandle)) return;
  const BundleRef bundle = bundles_.bundleEnclosingExecutable(*executable);
  if (!bundle || bundle->bundleIdentifier().empty()) return;
  peer.bundleIdentifier = bundle->bundleIdentifier();
  peer.entitlements = entitlements_.entitlementsForBundle(*peer.bundleIdentifier);
}

std::string deviceRootFromEnvironment() {
  std::string root = environment("QUORVEL_DEVICE_ROOT");
  while (root.ends_with('/')) root.pop_back();
  return root;
}

std::string bundlePathFromEnvironment() { return environment("QUORVEL_BUNDLE_PATH"); }

}  // namespace qv::platform
