#pragma once

#include <memory>
#include <string>

#include "platform/base/Result.h"
#include "platform/linux/ExtensionCgroups.h"
#include "platform/linux/ExtensionLog.h"
#include "platform/linux/ExtensionStarter.h"
#include "platform/linux/ExtensionUsers.h"
#include "platform/process/SpawnedProcess.h"

namespace qv::platform {

/// How extensions are launched on this device.
struct ExtensionLaunchOptions {
  /// The user's data, complete. An extension sees nothing of it but its container, in `Containers`.
  std::string dataDirectory;
  std::string launcherPath;  ///< of quorvel-extension-launcher
};

/// Where extensions have their containers.
std::string containersOf(const ExtensionLaunchOptions& options);

/// A process of an extension that is to be, and what goes with it.
struct ExtensionLaunch {
  SpawnRequest request;
  SharedFileDescriptor launcherLife;  ///< what `request` has of `life`; its guard gets it, too
  FileDescriptor life;                ///< the daemon's end of a pair of sockets; one byte lets the launcher go on
  FileDescriptor output;              ///< where its standard output and error come from
  ExtensionLog log;                   ///< and where they go
  std::string container;
  std::unique_ptr<ExtensionCgroup> cgroup;  ///< none where none can be made
};

/// Where the daemon's own installation has the launcher: beside the daemon, else in ../lib/quorveld.
[[nodiscard]] std::string installedExtensionLauncher();

/// Makes the extension's container where there is none yet, `<data directory>/Containers/<identifier>`, and puts
/// together its launch: the user, the confinement, a minimal environment, its output in "stderr.log" of its container,
/// and the two endpoints. Blocking.
[[nodiscard]] Result<ExtensionLaunch> makeExtensionLaunch(const ExtensionRecord& extension,
                                                          const ExtensionLaunchOptions& options,
                                                          const ExtensionEndpoints& endpoints, ExtensionUsers& users,
                                                          ExtensionCgroups& cgroups);

/// What the end of an extension's process was, for the log and for the requests that it ends.
[[nodiscard]] Error errorOfExtensionEnd(const std::string& identifier, int status);

}  // namespace qv::platform
