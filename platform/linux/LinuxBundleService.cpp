#include "platform/linux/LinuxBundleService.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <system_error>

#include "platform/Log.h"
#include "platform/linux/Json.h"

namespace qv::platform {
namespace {

namespace fs = std::filesystem;

constexpr const char* kInstalledRoots[] = {"/Applications", "/System/Applications", "/System/Library/Frameworks"};
constexpr const char kInfoFile[] = "/Info.json";
constexpr const char kLocalizedInfoName[] = "InfoPlist";
constexpr std::string_view kLocalizationSuffix = ".lproj";
constexpr int kMaximumDepth = 6;
constexpr int kMaximumDirectories = 10000;

bool isDirectory(const std::string& path) {
  struct stat info {};
  return ::stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

bool hasInfo(const std::string& directory) { return ::access((directory + kInfoFile).c_str(), F_OK) == 0; }

Dictionary readInfo(const std::string& path) {
  auto info = readJSONDictionary(path);
  if (info) return std::move(info.value());
  if (info.error().code != ENOENT) {
    QV_LOG_ERROR(logs::kPlatform, "bundle information %s: %s", path.c_str(), info.error().description().c_str());
  }
  return {};
}

/// The path without links and "..", or the empty string.
std::string canonicalPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> real(::realpath(path.c_str(), nullptr), &std::free);
  return real ? real.get() : std::string();
}

class DirectoryBundle final : public Bundle {
 public:
  DirectoryBundle(std::string path, Localization& localization)
      : path_(std::move(path)),
        info_(readInfo(path_ + kInfoFile)),
        identifier_(platform::valueForKey(info_, bundleinfo::kIdentifier).asString()),
        localization_(localization) {}

  const std::string& path() const override { return path_; }
  std::string resourcePath() const override {
    const std::string resources = path_ + "/Resources";
    return isDirectory(resources) ? resources : path_;
  }
  const std::string& bundleIdentifier() const override { return identifier_; }
  const Dictionary& infoDictionary() const override { return info_; }

  Dictionary localizedInfoDictionary() const override {
    const auto available = localizations();
    if (available.empty()) return {};
    const auto matches = localization_.matchLocalizations(available, localization_.preferredLanguages());
    if (matches.empty()) return {};
    const auto file = pathForResource(kLocalizedInfoName, "json", matches.front());
    return file ? readInfo(*file) : Dictionary{};
  }

  std::vector<std::string> localizations() const override {
    std::vector<std::string> names;
    std::error_code failure;
    for (fs::directory_iterator it(resourcePath(), failure), end; !failure && it != end; it.increment(failure)) {
      const std::string name = it->path().filename();
      if (!name.ends_with(kLocalizationSuffix) || !isDirectory(it->path())) continue;
      names.push_back(name.substr(0, name.size() - kLocalizationSuffix.size()));
    }
    std::sort(names.begin(), names.end());
    return names;
  }

  std::optional<std::string> pathForResource(std::string_view name, std::string_view type,
                                             std::string_view localization) const override {
    std::string directory = resourcePath();
    if (localization.find('/') != std::string_view::npos) return std::nullopt;
    if (!localization.empty()) directory.append("/").append(localization).append(kLocalizationSuffix);
    const std::string path = directory.append("/").append(name).append(".").append(type);
    if (::access(path.c_str(), F_OK) != 0) return std::nullopt;
    return path;
  }

 private:
  const std::string path_;
  const Dictionary info_;
  const std::string identifier_;
  Localization& localization_;
};

/// Whether a directory below a bundle may hold further bundles.
bool isWorthSearching(const fs::directory_entry& entry) {
  std::error_code failure;
  if (!entry.is_directory(failure) || entry.is_symlink(failure)) return false;
  const std::string name = entry.path().filename();
  return !name.starts_with('.') && !name.ends_with(kLocalizationSuffix) && name != "Resources";
}

/// Shows `visit` the bundles below a root, until it answers false; whether it never did.
bool visitBundles(const std::string& root, Localization& localization, int& budget,
                  const std::function<bool(const BundleRef&)>& visit) {
  std::error_code failure;
  fs::recursive_directory_iterator it(root, fs::directory_options::skip_permission_denied, failure);
  for (const fs::recursive_directory_iterator end; !failure && it != end && budget > 0; it.increment(failure)) {
    if (!isWorthSearching(*it)) {
      it.disable_recursion_pending();
      continue;
    }
    --budget;
    if (it.depth() + 1 >= kMaximumDepth) it.disable_recursion_pending();
    if (!hasInfo(it->path())) continue;
    if (!visit(std::make_shared<const DirectoryBundle>(it->path(), localization))) return false;
  }
  return true;
}

}  // namespace

LinuxBundleService::LinuxBundleService(const std::string& deviceRoot, const std::string& bundlePath,
                                       Localization& localization)
    : localization_(localization) {
  for (const char* root : kInstalledRoots) roots_.push_back(deviceRoot + root);
  for (size_t start = 0; start < bundlePath.size();) {
    const size_t end = std::min(bundlePath.find(':', start), bundlePath.size());
    const std::string root = bundlePath.substr(start, end - start);
    start = end + 1;
    if (root.starts_with('/')) {
      roots_.push_back(root);
    } else if (!root.empty()) {
      QV_LOG_ERROR(logs::kPlatform, "bundle root %s is ignored: it is no absolute path", root.c_str());
    }
  }
}

BundleRef LinuxBundleService::bundleAtPath(const std::string& path) {
  if (!isDirectory(path)) return nullptr;
  return std::make_shared<const DirectoryBundle>(path, localization_);
}

BundleRef LinuxBundleService::bundleWithIdentifier(const std::string& identifier) {
  if (identifier.empty()) return nullptr;
  int budget = kMaximumDirectories;
  BundleRef found;
  const auto visit = [&](const BundleRef& bundle) {
    if (bundle->bundleIdentifier() == identifier) found = bundle;
    return found == nullptr;
  };
  for (const std::string& root : roots_) {
    if (!visitBundles(root, localization_, budget, visit)) break;
  }
  return found;
}

std::vector<BundleRef> LinuxBundleService::installedBundles() {
  int budget = kMaximumDirectories;
  std::map<std::string, BundleRef> byPath;
  for (const std::string& root : roots_) {
    // A root may be given twice, or lie in another.
    visitBundles(canonicalPath(root), localization_, budget, [&](const BundleRef& bundle) {
      byPath.emplace(bundle->path(), bundle);
      return true;
    });
  }
  std::vector<BundleRef> bundles;
  for (auto& [path, bundle] : byPath) bundles.push_back(std::move(bundle));
  return bundles;
}

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

}  // namespace qv::platform
