#include "platform/linux/LocalExtensionStarter.h"

#include <unistd.h>

#include <utility>

#include "platform/linux/LaunchedProcess.h"
#include "platform/threads/Log.h"

namespace qv::platform {

LocalExtensionStarter::LocalExtensionStarter(ExtensionLaunchOptions options)
    : options_(std::move(options)), users_(containersOf(options_)) {
  if (::geteuid() == 0) return;
  QV_LOG(
      logs::kExtensions,
      "the daemon is not root: extensions run as its own user, without a bound of threads, a view of their own of the "
      "files, or protection of containers from each other but Landlock; the other bounds hold");
}

Result<std::unique_ptr<StartedExtension>> LocalExtensionStarter::start(const ExtensionRecord& extension,
                                                                       const ExtensionEndpoints& endpoints,
                                                                       StartedExtensionHandlers handlers) {
  auto launch = makeExtensionLaunch(extension, options_, endpoints, users_, cgroups_);
  if (!launch) return launch.error();
  auto process = LaunchedProcess::start(std::move(*launch), std::move(handlers));
  if (!process) return process.error();
  return std::unique_ptr<StartedExtension>(std::move(*process));
}

}  // namespace qv::platform
