#include "platform/linux/ExtensionLaunch.h"

#include <fcntl.h>
#include <sys/socket.h>
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
constexpr int kStatusNotConfined = 126;  // of the launcher
constexpr int kStatusNotRun = 127;

/// Nobody else but the daemon writes where it lies, so that a directory there is the one that was made.
std::optional<Error> makeContainer(const std::string& container) {
  if (auto error = makeDirectories(std::filesystem::path(container).parent_path())) return error;
  struct stat info {};
  if (::mkdir(container.c_str(), 0700) != 0 && errno != EEXIST) return Error::posix(errno, container);
  if (::lstat(container.c_str(), &info) != 0) return Error::posix(errno, container);
  return S_ISDIR(info.st_mode) ? std::nullopt : std::optional(Error::posix(ENOTDIR, container));
}

/// 0, the daemon's own, where it is not root and can give none.
Result<uid_t> userOf(const ExtensionRecord& extension, ExtensionUsers& users) {
  return ::geteuid() == 0 ? users.userOf(extension.identifier) : Result<uid_t>(uid_t{0});
}

/// Of what the program writes; it waits where nobody reads.
std::optional<Error> connectOutput(ExtensionLaunch& launch) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) return Error::posix(errno, "pipe");
  launch.output.reset(ends[0]);
  launch.request.output.reset(ends[1]);
  launch.request.joinsErrors = true;
  return ::fcntl(ends[0], F_SETFL, O_NONBLOCK) == 0 ? std::nullopt : std::optional(Error::posix(errno, "pipe"));
}

std::optional<Error> connectLife(ExtensionLaunch& launch) {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) return Error::posix(errno, "socketpair");
  launch.life.reset(ends[0]);
  launch.launcherLife = shareFileDescriptor(FileDescriptor(ends[1]));
  return std::nullopt;
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

std::string containersOf(const ExtensionLaunchOptions& options) { return options.dataDirectory + "/Containers"; }

Result<ExtensionLaunch> makeExtensionLaunch(const ExtensionRecord& extension, const ExtensionLaunchOptions& options,
                                            const ExtensionEndpoints& endpoints, ExtensionUsers& users,
                                            ExtensionCgroups& cgroups) {
  if (!isSafeFileStem(extension.identifier)) return Error::posix(EINVAL, extension.identifier);
  const std::string container = containersOf(options) + "/" + extension.identifier;
  if (auto error = makeContainer(container)) return *error;
  auto user = userOf(extension, users);
  if (!user) return user.error();
  ExtensionLaunch launch{.request = {},
                         .launcherLife = nullptr,
                         .life = {},
                         .output = {},
                         .log = ExtensionLog(container, *user),
                         .container = container,
                         .cgroup = cgroups.make()};
  if (auto error = connectOutput(launch)) return *error;
  if (auto error = connectLife(launch)) return *error;
  SpawnRequest& request = launch.request;
  request.program = options.launcherPath;
  request.arguments = {std::to_string(::getpid()), options.dataDirectory, extension.bundlePath, container,
                       extension.executablePath,   std::to_string(*user)};
  request.environment = makeEnvironment(container);
  request.descriptors = {endpoints.requests, endpoints.auxiliary, launch.launcherLife};
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
