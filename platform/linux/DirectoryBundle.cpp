#include "platform/linux/DirectoryBundle.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <system_error>

#include "platform/linux/Json.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

namespace fs = std::filesystem;

constexpr const char kLocalizedInfoName[] = "InfoPlist";

bool isDirectory(const std::string& path) {
  struct stat info {};
  return ::stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode);
}

Dictionary readInfo(const std::string& path) {
  auto info = readJSONDictionary(path);
  if (info) return std::move(info.value());
  if (info.error().code != ENOENT) {
    QV_LOG_ERROR(logs::kPlatform, "bundle information %s: %s", path.c_str(), info.error().description().c_str());
  }
  return {};
}

}  // namespace

std::string canonicalPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> real(::realpath(path.c_str(), nullptr), &std::free);
  return real ? real.get() : std::string();
}

DirectoryBundle::DirectoryBundle(std::string path, Localization& localization)
    : path_(std::move(path)),
      info_(readInfo(path_ + "/Info.json")),
      identifier_(platform::valueForKey(info_, bundleinfo::kIdentifier).asString()),
      localization_(localization) {}

std::string DirectoryBundle::resourcePath() const {
  const std::string resources = path_ + "/Resources";
  return isDirectory(resources) ? resources : path_;
}

Dictionary DirectoryBundle::localizedInfoDictionary() const {
  const auto available = localizations();
  if (available.empty()) return {};
  const auto matches = localization_.matchLocalizations(available, localization_.preferredLanguages());
  if (matches.empty()) return {};
  const auto file = pathForResource(kLocalizedInfoName, "json", matches.front());
  return file ? readInfo(*file) : Dictionary{};
}

std::vector<std::string> DirectoryBundle::localizations() const {
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

std::optional<std::string> DirectoryBundle::pathForResource(std::string_view name, std::string_view type,
                                                            std::string_view localization) const {
  std::string directory = resourcePath();
  if (localization.find('/') != std::string_view::npos) return std::nullopt;
  if (!localization.empty()) directory.append("/").append(localization).append(kLocalizationSuffix);
  const std::string path = directory.append("/").append(name).append(".").append(type);
  if (::access(path.c_str(), F_OK) != 0) return std::nullopt;
  return path;
}

}  // namespace qv::platform
