#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "platform/Bundles.h"

/// Bundle utilities: localized texts of the framework bundle, names of applications, the bundle of
/// a process. None logs a missing thing; its result tells.
///
/// Threading: thread-safe, blocking (small files).
namespace qv {

/// The framework bundle; made at its first use and kept as long as the platform is installed.
/// Nothing while there is no such directory.
[[nodiscard]] platform::BundleRef _qvFrameworkBundle();

/// The text of `key`, from the first of these that exists: the localized bundle, the fallback
/// bundle, the framework bundle's own default localization. A table that lacks the key yields the
/// key itself; nothing only when none of the three exists.
[[nodiscard]] std::optional<std::string> _qvLocalizedStringFromFrameworkBundleWithKey(const std::string& key);

/// The framework's localization directory that best matches the user's languages.
[[nodiscard]] platform::BundleRef localizedBundle();
/// The framework's localization directory with a table for the user's first language without region
/// and script (zh for zh-Hant-TW).
[[nodiscard]] platform::BundleRef fallbackBundle();

/// The name that the user sees; the empty string where the bundle has none.
[[nodiscard]] std::string _qvLocalizedAppName(const platform::Bundle& bundle);
/// The same by bundle identifier; nothing when no such bundle is installed.
[[nodiscard]] std::optional<std::string> _qvLocalizedAppNameFromBundleID(const std::string& bundleID);

/// The PNG file that the bundle names as its icon, of 1 MiB at most; empty without.
[[nodiscard]] platform::Data _qvAppIconFromBundleID(const std::string& bundleID);

/// The bundle that encloses a process's executable.
[[nodiscard]] platform::BundleRef bundleWithPID(pid_t pid);

/// The identifier without its last dot-separated component: A.B for A.B.C, the empty string for A.
[[nodiscard]] std::optional<std::string> baseIdentifier(const std::optional<std::string>& identifier);

}  // namespace qv
