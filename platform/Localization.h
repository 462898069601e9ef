#pragma once

#include <string>
#include <vector>

#include "platform/base/Value.h"

namespace qv::platform {

/// The user's languages and the texts that depend on them.
///
/// Threading: thread-safe.
class Localization {
 public:
  virtual ~Localization() = default;
  /// BCP 47 tags, most preferred first; never empty.
  [[nodiscard]] virtual std::vector<std::string> preferredLanguages() = 0;
  /// Orders `available` localizations by the preferences, best first; those that match nothing
  /// are left out, unless nothing at all matches: then "en" or the first stands alone.
  [[nodiscard]] virtual std::vector<std::string> matchLocalizations(const std::vector<std::string>& available,
                                                                    const std::vector<std::string>& preferred) = 0;
  /// A date in the local time zone, by a pattern of the CLDR kind ("MM-dd-yyyy HH:mm:ss").
  [[nodiscard]] virtual std::string formatDate(Date date, const std::string& pattern) = 0;
  /// Whether `text` begins with `prefix`, without regard to case and diacritics.
  [[nodiscard]] virtual bool beginsWithFolded(const std::string& text, const std::string& prefix) = 0;
};

}  // namespace qv::platform
