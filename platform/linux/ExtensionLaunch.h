#pragma once

#include <string>

#include "platform/Extensions.h"
#include "platform/base/Result.h"
#include "platform/process/SpawnedProcess.h"

namespace qv::platform {

/// How extensions are launched on this device.
struct ExtensionLaunchOptions {
  /// The user's data, complete. An extension sees nothing of it but its container, in `Containers`.
  std::string dataDirectory;
  std::string launcherPath;  ///< of quorvel-extension-launcher
  /// As root: runs extensions as users of their own even where the kernel confines well enough without.
  bool alwaysAnotherUser = false;
};

/// Where the daemon's own installation has the launcher: beside the daemon, else in ../lib/quorveld.
[[nodiscard]] std::string installedExtensionLauncher();

/// Makes the extension's container where there is none yet, `<data directory>/Containers/<identifier>`,
/// and puts together its launch: confinement, a minimal environment, its output in "stderr.log" of its container, and
/// the two endpoints. Blocking.
[[nodiscard]] Result<SpawnRequest> makeExtensionLaunch(const ExtensionRecord& extension,
                                                       const ExtensionLaunchOptions& options,
                                                       const ListenerEndpoint& requests,
                                                       const ListenerEndpoint& auxiliary);

/// What the end of an extension's process was, for the log and for the requests that it ends.
[[nodiscard]] Error errorOfExtensionEnd(const std::string& identifier, int status);

}  // namespace qv::platform
