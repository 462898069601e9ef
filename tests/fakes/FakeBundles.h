#pragma once

#include <algorithm>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/Bundles.h"

namespace qv::fakes {

/// A bundle whose fields the test fills in before it hands it over.
class FakeBundle final : public platform::Bundle {
 public:
  explicit FakeBundle(std::string path, std::string identifier = {})
      : path_(std::move(path)), identifier_(std::move(identifier)) {
    if (!identifier_.empty()) info[platform::bundleinfo::kIdentifier] = platform::Value(identifier_);
  }

  platform::Dictionary info;
  platform::Dictionary localizedInfo;
  /// Whether resources stand in "Resources" below the bundle, or in the bundle itself.
  bool hasResourceDirectory = true;
  /// Resource file names by localization, e.g. {"en", {"Localizable.strings"}}; those under the
  /// empty localization stand in the resource directory itself.
  std::map<std::string, std::vector<std::string>, std::less<>> resources;

  const std::string& path() const override { return path_; }
  std::string resourcePath() const override { return hasResourceDirectory ? path_ + "/Resources" : path_; }
  const std::string& bundleIdentifier() const override { return identifier_; }
  const platform::Dictionary& infoDictionary() const override { return info; }
  platform::Dictionary localizedInfoDictionary() const override { return localizedInfo; }
  std::vector<std::string> localizations() const override {
    std::vector<std::string> names;
    for (const auto& [name, files] : resources) {
      if (!name.empty()) names.push_back(name);
    }
    return names;
  }
  std::optional<std::string> pathForResource(std::string_view name, std::string_view type,
                                             std::string_view localization) const override {
    const auto it = resources.find(localization);
    const std::string file = std::string(name) + "." + std::string(type);
    if (it == resources.end() || std::find(it->second.begin(), it->second.end(), file) == it->second.end()) {
      return std::nullopt;
    }
    const std::string directory = localization.empty() ? "" : "/" + it->first + ".lproj";
    return resourcePath() + directory + "/" + file;
  }

 private:
  const std::string path_;
  const std::string identifier_;
};

/// Bundles and processes that the test put there. Any directory that was added is a bundle.
///
/// Threading: thread-safe.
class FakeBundleService final : public platform::BundleService {
 public:
  void add(std::shared_ptr<const FakeBundle> bundle) {
    std::lock_guard lock(mutex_);
    bundles_[bundle->path()] = std::move(bundle);
  }
  /// Adds a bundle at /Applications/<name> with an identifier and a display name.
  std::shared_ptr<FakeBundle> addApplication(const std::string& name, const std::string& identifier) {
    auto bundle = std::make_shared<FakeBundle>("/Applications/" + name, identifier);
    bundle->info[platform::bundleinfo::kDisplayName] = platform::Value(name);
    add(bundle);
    return bundle;
  }
  void removeBundleAtPath(const std::string& path) {
    std::lock_guard lock(mutex_);
    bundles_.erase(path);
  }
  void setProcess(pid_t pid, const std::string& executablePath) {
    std::lock_guard lock(mutex_);
    processes_[pid] = executablePath;
  }

  platform::BundleRef bundleAtPath(const std::string& path) override {
    std::lock_guard lock(mutex_);
    const auto it = bundles_.find(path);
    return it == bundles_.end() ? nullptr : it->second;
  }
  platform::BundleRef bundleWithIdentifier(const std::string& identifier) override {
    std::lock_guard lock(mutex_);
    for (const auto& [path, bundle] : bundles_) {
      if (!identifier.empty() && bundle->bundleIdentifier() == identifier) return bundle;
    }
    return nullptr;
  }
  platform::BundleRef bundleEnclosingExecutable(const std::string& executablePath) override {
    std::lock_guard lock(mutex_);
    platform::BundleRef nearest;
    for (const auto& [path, bundle] : bundles_) {
      const bool encloses = executablePath.starts_with(path + "/");
      if (encloses && (!nearest || path.size() > nearest->path().size())) nearest = bundle;
    }
    return nearest;
  }
  std::optional<std::string> executablePathOfProcess(pid_t pid) override {
    std::lock_guard lock(mutex_);
    const auto it = processes_.find(pid);
    return it == processes_.end() ? std::nullopt : std::optional(it->second);
  }

 private:
  std::mutex mutex_;
  std::map<std::string, std::shared_ptr<const FakeBundle>> bundles_;
  std::map<pid_t, std::string> processes_;
};

}  // namespace qv::fakes
