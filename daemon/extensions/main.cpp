// Starts extensions for the daemon, so that the daemon needs neither the rights nor the network that this takes:
//
//   quorveld-extensions
//
// with a listening local socket of sequenced packets as descriptor 3, as the service manager hands it over. It is root,
// and serves root alone. What it started ends with it.
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <thread>

#include "platform/linux/DeviceRoot.h"
#include "platform/linux/ExtensionStarterServer.h"
#include "platform/linux/LocalExtensionStarter.h"
#include "platform/threads/Log.h"
#include "platform/threads/RunLoop.h"
#include "support/QVDeviceLayout.h"

namespace {

using namespace qv::platform;

constexpr int kListeningSocket = 3;

/// Nobody is shown a text of a bundle here.
///
/// Threading: thread-safe.
class NoTexts final : public Localization {
 public:
  std::vector<std::string> preferredLanguages() override { return {"en"}; }
  std::vector<std::string> matchLocalizations(const std::vector<std::string>&,
                                              const std::vector<std::string>&) override {
    return {};
  }
  std::string formatDate(Date, const std::string&) override { return {}; }
  bool beginsWithFolded(const std::string&, const std::string&) override { return false; }
};

bool isListening(const FileDescriptor& socket) {
  int accepts = 0;
  socklen_t size = sizeof accepts;
  return ::getsockopt(socket.get(), SOL_SOCKET, SO_ACCEPTCONN, &accepts, &size) == 0 && accepts != 0;
}

/// Without taking anything down: connections have threads, and their extensions have guards.
[[noreturn]] void leave(int status) {
  flushLog();
  std::_Exit(status);
}

[[noreturn]] void serve(const FileDescriptor& listening) {
  const std::string root = deviceRootFromEnvironment();
  NoTexts texts;
  LinuxBundleService bundles(root, bundlePathFromEnvironment(), texts);
  LocalExtensionStarter starter(
      {.dataDirectory = root + qv::kDataDirectory, .launcherPath = installedExtensionLauncher()});
  ExtensionStarterServer server(bundles, starter);
  QV_LOG_ERROR(logs::kExtensions, "nobody is served any more: %s", server.run(listening).description().c_str());
  leave(EXIT_FAILURE);
}

}  // namespace

int main() {
  // Before any thread is made, so that all inherit it.
  blockTerminationSignals();
  // The containers' directory is for every extension to pass through.
  ::umask(022);
  const FileDescriptor listening(kListeningSocket);
  if (::geteuid() != 0 || !isListening(listening)) {
    QV_LOG_ERROR(logs::kExtensions, "this is for root, with a listening socket as descriptor %d", kListeningSocket);
    leave(EXIT_FAILURE);
  }
  ::fcntl(listening.get(), F_SETFD, FD_CLOEXEC);
  std::thread([&] { serve(listening); }).detach();
  (void)runMainRunLoop();
  leave(EXIT_SUCCESS);
}
