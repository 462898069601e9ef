#pragma once

#include <functional>
#include <string>

#include "platform/Bundles.h"
#include "platform/Localization.h"
#include "platform/Preferences.h"

namespace qv::platform {

/// Languages, dates and folding by ICU, whose data is touched at the first use only.
///
/// The preferred languages are the array of tags "Languages" of a preference domain, so that a settings screen decides;
/// without it those of the environment
/// (LANGUAGE, LC_ALL, LC_MESSAGES, LANG, as gettext reads them); without those "en".
///
/// Threading: thread-safe.
class ICULocalization final : public Localization {
 public:
  using Environment = std::function<std::string(const char* name)>;
  /// `preferences` must outlive this. `environment` yields the empty string for what is not set.
  ICULocalization(PreferenceStore& preferences, std::string preferenceDomain,
                  Environment environment = processEnvironment());

  [[nodiscard]] std::vector<std::string> preferredLanguages() override;
  [[nodiscard]] std::vector<std::string> matchLocalizations(const std::vector<std::string>& available,
                                                            const std::vector<std::string>& preferred) override;
  /// In the user's first language, yet always in the Gregorian calendar and with digits 0 to 9: dates
  /// become file names.
  [[nodiscard]] std::string formatDate(Date date, const std::string& pattern) override;
  [[nodiscard]] bool beginsWithFolded(const std::string& text, const std::string& prefix) override;

 private:
  static Environment processEnvironment();

  PreferenceStore& preferences_;
  const std::string preferenceDomain_;
  const Environment environment_;
};

}  // namespace qv::platform
