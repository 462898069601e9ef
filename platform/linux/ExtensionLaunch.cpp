#include "platform/linux/ExtensionLaunch.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <system_error>
#include <utility>

#include "platform/linux/SmallFile.h"
#include "protocol/ExtensionRequests.h"

namespace qv::platform {
namespace {

constexpr const char kLauncher[] = "quorvel-extension-launcher";
constexpr const char kContainers[] = "/Containers";
constexpr int kStatusNotConfined = 126;  // of the launcher
constexpr int kStatusNotRun = 127;

/// Nobody else but the daemon writes where it lies, so that a directory there is the one that was made.
std::optional<Error> makeContainer(const std::string& container) {
  if (auto error = makeDirectories(std::filesystem::path(container).parent_path())) return error;
  struct stat info {};
  if (::mkdir(container.c_str(), 0700) != 0 && errno != EEXIST) return Error::posix(errno, container);
  if (::lstat(container.c_str(), &info) != 0) return Error::posix(errno, container);
  if (!S_ISDIR(info.st_mode)) return Error::posix(ENOTDIR, container);
  (void)::mkdir((container + "/tmp").c_str(), 0700);
  return std::nullopt;
}

/// Made anew, since whatever lies there is the extension's: it may have left a link or a pipe.
FileDescriptor openOutput(const std::string& container) {
  const std::string path = container + "/stderr.log";
  (void)::unlink(path.c_str());
  return FileDescriptor(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_APPEND | O_CLOEXEC, 0600));
}

std::vector<std::string> makeEnvironment(const std::string& container) {
  std::vector<std::string> environment{"PATH=/usr/bin:/bin", "HOME=" + container, "TMPDIR=" + container + "/tmp",
                                       std::string(kExtensionRequestsEndpointVariable) + "=3",
                                       std::string(kExtensionAuxiliaryEndpointVariable) + "=4"};
  for (const char* name : {"LANG", "LC_ALL", "TZ"}) {
    const char* value = std::getenv(name);
    if (value != nullptr) environment.push_back(std::string(name) + "=" + value);
  }
  return environment;
}

}  // namespace

std::string installedExtensionLauncher() {
  namespace fs = std::filesystem;
  std::error_code error;
  const fs::path directory = fs::read_symlink("/proc/self/exe", error).parent_path();
  return fs::exists(directory / kLauncher, error) ? directory / kLauncher : directory / "../lib/quorveld" / kLauncher;
}

Result<SpawnRequest> makeExtensionLaunch(const ExtensionRecord& extension, const ExtensionLaunchOptions& options,
                                         const ListenerEndpoint& requests, const ListenerEndpoint& auxiliary) {
  if (!isSafeFileStem(extension.identifier)) return Error::posix(EINVAL, extension.identifier);
  const std::string container = options.dataDirectory + kContainers + "/" + extension.identifier;
  if (auto error = makeContainer(container)) return *error;
  SpawnRequest launch;
  launch.program = options.launcherPath;
  launch.arguments = {std::to_string(::getpid()), options.dataDirectory, extension.bundlePath, container,
                      extension.executablePath};
  if (options.alwaysAnotherUser) launch.arguments.emplace_back("another-user");
  launch.environment = makeEnvironment(container);
  launch.output = openOutput(container);
  launch.joinsErrors = true;
  launch.descriptors = {requests.rendezvous(), auxiliary.rendezvous()};
  return launch;
}

Error errorOfExtensionEnd(const std::string& identifier, int status) {
  const std::string name = "extension " + identifier;
  if (WIFSIGNALED(status))
    return Error::posix(ECONNRESET, name + " ended by signal " + std::to_string(WTERMSIG(status)));
  if (WEXITSTATUS(status) == kStatusNotConfined)
    return Error::posix(EPERM, name + " cannot be confined, so it is not run (stderr.log in its container)");
  if (WEXITSTATUS(status) == kStatusNotRun)
    return Error::posix(ENOEXEC, name + " cannot be run (stderr.log in its container)");
  return Error::posix(ECONNRESET, name + " ended with status " + std::to_string(WEXITSTATUS(status)));
}

}  // namespace qv::platform
