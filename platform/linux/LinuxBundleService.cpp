#include "platform/linux/LinuxBundleService.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <climits>
#include <cstdio>
#include <filesystem>
#include <system_error>

#include "platform/linux/DirectoryBundle.h"
#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr const char* kInstalledRoots[] = {"/Applications", "/System/Applications", "/System/Library/Frameworks"};
constexpr const char kInfoFile[] = "/Info.json";

bool hasInfo(const std::string& directory) { return ::access((directory + kInfoFile).c_str(), F_OK) == 0; }

std::vector<std::string> rootsOf(const std::string& deviceRoot, const std::string& bundlePath) {
  std::vector<std::string> roots;
  for (const char* root : kInstalledRoots) roots.push_back(deviceRoot + root);
  for (size_t start = 0; start < bundlePath.size();) {
    const size_t end = std::min(bundlePath.find(':', start), bundlePath.size());
    const std::string root = bundlePath.substr(start, end - start);
    start = end + 1;
    if (root.starts_with('/')) {
      roots.push_back(root);
    } else if (!root.empty()) {
      QV_LOG_ERROR(logs::kPlatform, "bundle root %s is ignored: it is no absolute path", root.c_str());
    }
  }
  return roots;
}

}  // namespace

LinuxBundleService::LinuxBundleService(const std::string& deviceRoot, const std::string& bundlePath,
                                       Localization& localization)
    : roots_(rootsOf(deviceRoot, bundlePath)), localization_(localization), index_(roots_, localization) {}

BundleRef LinuxBundleService::bundleAtPath(const std::string& path) {
  std::error_code failure;
  if (!std::filesystem::is_directory(path, failure)) return nullptr;
  return std::make_shared<const DirectoryBundle>(path, localization_);
}

BundleRef LinuxBundleService::bundleWithIdentifier(const std::string& identifier) { return index_.find(identifier); }

std::vector<BundleRef> LinuxBundleService::installedBundles() { return index_.all(); }

BundleRef LinuxBundleService::bundleEnclosingExecutable(const std::string& executablePath) {
  const std::string executable = canonicalPath(executablePath);
  for (const std::string& root : roots_) {
    const std::string realRoot = canonicalPath(root);
    if (realRoot.empty() || !executable.starts_with(realRoot + "/")) continue;
    std::string directory = executable.substr(0, executable.rfind('/'));
    for (; directory.size() > realRoot.size(); directory.resize(directory.rfind('/'))) {
      if (hasInfo(directory)) return std::make_shared<const DirectoryBundle>(directory, localization_);
    }
  }
  return nullptr;
}

std::optional<std::string> LinuxBundleService::executablePathOfProcess(pid_t pid) {
  if (pid <= 0) return std::nullopt;
  const std::string link = "/proc/" + std::to_string(pid) + "/exe";
  char path[PATH_MAX];
  const ssize_t length = ::readlink(link.c_str(), path, sizeof path);
  if (length <= 0 || static_cast<size_t>(length) >= sizeof path) return std::nullopt;
  const std::string executable(path, static_cast<size_t>(length));
  struct stat running {};
  struct stat found {};
  if (::stat(link.c_str(), &running) != 0 || ::stat(executable.c_str(), &found) != 0 ||
      running.st_dev != found.st_dev || running.st_ino != found.st_ino) {
    QV_LOG(logs::kPlatform, "process %d does not run what is at %s", pid, executable.c_str());
    return std::nullopt;
  }
  return executable;
}

std::optional<uid_t> LinuxBundleService::userOfProcess(pid_t pid) {
  if (pid <= 0) return std::nullopt;
  const auto status = readSmallFile("/proc/" + std::to_string(pid) + "/status");
  if (!status) return std::nullopt;
  // "Uid:", then the real, effective, saved and file system's one. The owner of the directory says less: it is root
  // for whoever may not be debugged.
  const std::string& text = status.value();
  const size_t line = text.find("\nUid:");
  unsigned real = 0;
  unsigned effective = 0;
  if (line == std::string::npos || std::sscanf(text.c_str() + line, " Uid: %u %u", &real, &effective) != 2) {
    return std::nullopt;
  }
  return effective;
}

}  // namespace qv::platform
