#pragma once

#include <string>
#include <vector>

#include "platform/Bundles.h"
#include "platform/Localization.h"
#include "platform/linux/BundleIndex.h"

namespace qv::platform {

/// Bundles as directories with an "Info.json".
///
/// The installed roots are /Applications, /System/Applications and /System/Library/Frameworks under
/// the device root; after them come those of `bundlePath` (absolute directories, separated by ':').
/// Below a bundle only its directory "PlugIns" is searched. An application that is installed or updated is seen at
/// once, though what is found is kept (BundleIndex).
///
/// A process can mount what it likes where it likes in a mount namespace of its own, and the kernel
/// then tells its executable's path as seen from there. So a path is believed only when this process
/// finds the very same file under it; the executable of a process that was replaced or deleted
/// since it started has no path.
///
/// Threading: thread-safe, blocking.
class LinuxBundleService final : public BundleService {
 public:
  /// `localization` must outlive this and its bundles.
  LinuxBundleService(const std::string& deviceRoot, const std::string& bundlePath, Localization& localization);

  [[nodiscard]] BundleRef bundleAtPath(const std::string& path) override;
  /// Of several the first, by root and path; as long as that one stays as it is, nothing is searched.
  [[nodiscard]] BundleRef bundleWithIdentifier(const std::string& identifier) override;
  /// Every bundle below the roots, also the plug-ins of others, sorted by path; paths have no links in them.
  [[nodiscard]] std::vector<BundleRef> installedBundles();
  [[nodiscard]] BundleRef bundleEnclosingExecutable(const std::string& executablePath) override;
  [[nodiscard]] std::optional<std::string> executablePathOfProcess(pid_t pid) override;
  [[nodiscard]] std::optional<uid_t> userOfProcess(pid_t pid) override;

 private:
  const std::vector<std::string> roots_;
  Localization& localization_;
  BundleIndex index_;
};

}  // namespace qv::platform
