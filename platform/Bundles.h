#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Value.h"

namespace qv::platform {

/// Keys of a bundle's information dictionary (Info.json).
namespace bundleinfo {
inline constexpr const char kIdentifier[] = "CFBundleIdentifier";
inline constexpr const char kDisplayName[] = "CFBundleDisplayName";
inline constexpr const char kName[] = "CFBundleName";
/// The name of a PNG file in the bundle's resources, with or without ".png".
inline constexpr const char kIconFile[] = "CFBundleIconFile";
}  // namespace bundleinfo

/// A directory with an information dictionary, resources and executables.
///
/// Threading: immutable, so thread-safe. Resources are read from disk at each call.
class Bundle {
 public:
  virtual ~Bundle() = default;
  [[nodiscard]] virtual const std::string& path() const = 0;
  /// Where the localizations stand: "Resources" below the bundle when that exists, else the bundle.
  [[nodiscard]] virtual std::string resourcePath() const = 0;
  /// Empty when the bundle has none.
  [[nodiscard]] virtual const std::string& bundleIdentifier() const = 0;
  [[nodiscard]] virtual const Dictionary& infoDictionary() const = 0;
  /// The information dictionary of the user's best localization ("InfoPlist.json" in its
  /// directory); empty when there is none.
  [[nodiscard]] virtual Dictionary localizedInfoDictionary() const = 0;
  /// Names of the ".lproj" directories, sorted.
  [[nodiscard]] virtual std::vector<std::string> localizations() const = 0;
  /// The path of a resource `name`.`type` of one localization, or, with the empty localization, in
  /// the resource directory itself; nothing when it does not exist.
  [[nodiscard]] virtual std::optional<std::string> pathForResource(std::string_view name, std::string_view type,
                                                                   std::string_view localization) const = 0;
};
using BundleRef = std::shared_ptr<const Bundle>;

/// Finds bundles, in directories that clients cannot write: the installed bundle roots under the
/// device root, and those that QUORVEL_BUNDLE_PATH (directories, separated by ':') names.
///
/// Threading: thread-safe, blocking.
class BundleService {
 public:
  virtual ~BundleService() = default;
  /// A bundle at a directory, whether or not it has an information dictionary; nothing when there
  /// is no such directory.
  [[nodiscard]] virtual BundleRef bundleAtPath(const std::string& path) = 0;
  [[nodiscard]] virtual BundleRef bundleWithIdentifier(const std::string& identifier) = 0;
  /// The nearest bundle above an executable, inside a bundle root; nothing where there is none.
  [[nodiscard]] virtual BundleRef bundleEnclosingExecutable(const std::string& executablePath) = 0;
  /// The path of a process's executable; nothing where it cannot be read.
  [[nodiscard]] virtual std::optional<std::string> executablePathOfProcess(pid_t pid) = 0;
  /// The effective user of a process; nothing where there is no such process.
  [[nodiscard]] virtual std::optional<uid_t> userOfProcess(pid_t pid) = 0;
};

}  // namespace qv::platform
