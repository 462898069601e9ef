#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "platform/Bundles.h"
#include "platform/Platform.h"
#include "platform/threads/Guarded.h"

namespace qv {

/// Bundle utilities: localized texts of the framework bundle, names of applications, the bundle of
/// a process. None logs a missing thing; its result tells.
///
/// The platform is borrowed, and must outlive this.
///
/// Threading: thread-safe, blocking (small files).
class QVBundleTexts {
 public:
  explicit QVBundleTexts(const platform::Platform& platform) : platform_(platform) {}

  /// The framework bundle; made at its first use and kept. Nothing while there is no such directory.
  [[nodiscard]] platform::BundleRef _qvFrameworkBundle() const;

  /// The text of `key`, from the first of these that exists: the localized bundle, the fallback
  /// bundle, the framework bundle's own default localization. A table that lacks the key yields the
  /// key itself; nothing only when none of the three exists.
  [[nodiscard]] std::optional<std::string> _qvLocalizedStringFromFrameworkBundleWithKey(const std::string& key) const;
  /// The same; the key itself also where there is no framework.
  [[nodiscard]] std::string localizedText(const std::string& key) const;

  /// The framework's localization directory that best matches the user's languages.
  [[nodiscard]] platform::BundleRef localizedBundle() const;
  /// The framework's localization directory with a table for the user's first language without region
  /// and script (zh for zh-Hant-TW).
  [[nodiscard]] platform::BundleRef fallbackBundle() const;

  /// The name that the user sees; the empty string where the bundle has none.
  [[nodiscard]] static std::string _qvLocalizedAppName(const platform::Bundle& bundle);
  /// The same by bundle identifier; nothing when no such bundle is installed.
  [[nodiscard]] std::optional<std::string> _qvLocalizedAppNameFromBundleID(const std::string& bundleID) const;

  /// The PNG file that the bundle names as its icon, of 1 MiB at most; empty without.
  [[nodiscard]] platform::Data _qvAppIconFromBundleID(const std::string& bundleID) const;

  /// The bundle that encloses a process's executable.
  [[nodiscard]] platform::BundleRef bundleWithPID(pid_t pid) const;

  /// The identifier without its last dot-separated component: A.B for A.B.C, the empty string for A.
  [[nodiscard]] static std::string baseIdentifier(const std::string& identifier);

 private:
  [[nodiscard]] std::string stringInTable(const platform::Bundle& bundle, const std::string& localization,
                                          const std::string& key) const;

  const platform::Platform& platform_;
  mutable platform::Guarded<platform::BundleRef> framework_;
};

}  // namespace qv
