#include "platform/linux/ExtensionManifest.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <memory>
#include <string_view>
#include <utility>

#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

constexpr size_t kMaximumIcons = 16;
constexpr std::array<uint8_t, 8> kPNGSignature = {0x89, 'P', 'N', 'G', '\r', '\n', 0x1A, '\n'};

Error malformed(const std::string& what) {
  return {kPosixErrorDomain, EBADMSG, {{kLocalizedDescriptionKey, Value("extension manifest: " + what)}}};
}

/// Whether a path stays below where it starts, as far as its text goes; links are looked at when it is used.
bool isInnerPath(std::string_view path) {
  if (path.empty() || path.front() == '/') return false;
  for (size_t start = 0; start <= path.size();) {
    const size_t end = std::min(path.find('/', start), path.size());
    if (path.substr(start, end - start) == "..") return false;
    start = end + 1;
  }
  return true;
}

/// Where `path` really is, if that is within the directory `root`; else the empty string.
std::string realPathWithin(const std::string& root, const std::string& path) {
  using Path = std::unique_ptr<char, decltype(&std::free)>;
  const Path realRoot(::realpath(root.c_str(), nullptr), &std::free);
  const Path real(::realpath(path.c_str(), nullptr), &std::free);
  if (!realRoot || !real || !std::string_view(real.get()).starts_with(std::string(realRoot.get()) + "/")) return {};
  return real.get();
}

Result<std::string> findExecutable(const Bundle& bundle, const std::string& name) {
  std::string path = realPathWithin(bundle.path(), bundle.path() + "/" + name);
  if (path.empty()) return Error::posix(ENOENT, "executable " + name + " in the bundle");
  struct stat info {};
  if (::stat(path.c_str(), &info) != 0 || !S_ISREG(info.st_mode) || (info.st_mode & S_IXUSR) == 0) {
    return Error::posix(EACCES, "executable " + name);
  }
  return path;
}

std::vector<Data> readIcons(const Bundle& bundle, const std::vector<std::string>& names) {
  std::vector<Data> icons;
  for (const std::string& name : names) {
    const std::string path = realPathWithin(bundle.path(), bundle.resourcePath() + "/" + name);
    const auto content = path.empty() ? Result<std::string>(Error::posix(ENOENT, name)) : readSmallFile(path);
    if (!content || content.value().size() < kPNGSignature.size() ||
        !std::equal(kPNGSignature.begin(), kPNGSignature.end(), content.value().begin(),
                    [](uint8_t a, char b) { return a == static_cast<uint8_t>(b); })) {
      QV_LOG_ERROR(logs::kExtensions, "extension %s: icon %s is left out: %s", bundle.path().c_str(), name.c_str(),
                   content ? "no PNG file" : content.error().description().c_str());
      continue;
    }
    icons.emplace_back(content.value().begin(), content.value().end());
  }
  return icons;
}

/// As the user sees it.
std::string displayNameOf(const Bundle& bundle) {
  const std::string localized = valueForKey(bundle.localizedInfoDictionary(), bundleinfo::kDisplayName).asString();
  if (!localized.empty()) return localized;
  const std::string name = valueForKey(bundle.infoDictionary(), bundleinfo::kDisplayName).asString();
  return name.empty() ? valueForKey(bundle.infoDictionary(), bundleinfo::kName).asString() : name;
}

}  // namespace

bool isExtensionInfo(const Dictionary& info) { return find(info, extensioninfo::kSection) != nullptr; }

Result<ExtensionManifest> parseExtensionManifest(const Dictionary& info) {
  ExtensionManifest manifest;
  const Value value = valueForKey(info, extensioninfo::kSection);
  const auto* section = value.getIf<Dictionary>();
  if (section == nullptr) return malformed(std::string(extensioninfo::kSection) + " is no dictionary");
  manifest.identifier = valueForKey(info, bundleinfo::kIdentifier).asString();
  if (!isSafeFileStem(manifest.identifier)) return malformed("the bundle identifier is missing or unusable");
  manifest.extensionPointIdentifier = valueForKey(*section, extensioninfo::kPointIdentifier).asString();
  if (manifest.extensionPointIdentifier.empty()) return malformed("no extension point");
  manifest.executable = valueForKey(*section, extensioninfo::kExecutable).asString();
  if (!isInnerPath(manifest.executable)) return malformed("the executable is missing, or not below the bundle");
  const Value icons = valueForKey(*section, extensioninfo::kIcons);
  for (const Value& icon : icons.asArray()) {
    std::string name = icon.asString();
    if (isInnerPath(name) && manifest.icons.size() < kMaximumIcons) manifest.icons.push_back(std::move(name));
  }
  manifest.attributes = valueForKey(*section, extensioninfo::kAttributes).asDictionary();
  return manifest;
}

Result<ExtensionRecordRef> makeExtensionRecord(const Bundle& bundle) {
  auto manifest = parseExtensionManifest(bundle.infoDictionary());
  if (!manifest) return manifest.error();
  auto executable = findExecutable(bundle, manifest->executable);
  if (!executable) return executable.error();
  auto record = std::make_shared<ExtensionRecord>();
  record->identifier = std::move(manifest->identifier);
  record->extensionPointIdentifier = std::move(manifest->extensionPointIdentifier);
  record->attributes = std::move(manifest->attributes);
  record->infoDictionary = bundle.infoDictionary();
  record->displayName = displayNameOf(bundle);
  record->icons = readIcons(bundle, manifest->icons);
  record->bundlePath = bundle.path();
  record->executablePath = std::move(*executable);
  return ExtensionRecordRef(std::move(record));
}

}  // namespace qv::platform
