#include "platform/linux/ICULocalization.h"

#include <unicode/localematcher.h>
#include <unicode/locid.h>
#include <unicode/normalizer2.h>
#include <unicode/smpdtfmt.h>
#include <unicode/timezone.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>

#include <algorithm>
#include <cstdlib>
#include <memory>
#include <utility>

namespace qv::platform {
namespace {

constexpr const char kLanguagesKey[] = "Languages";
constexpr const char kDefaultLanguage[] = "en";

/// The BCP 47 tag of a POSIX locale name ("pt_BR.UTF-8" is pt-BR, "sr_RS@latin" sr-Latn-RS); the empty
/// string for the locales without a language.
std::string tagFromLocaleName(const std::string& name) {
  const std::string base = name.substr(0, name.find_first_of(".@"));
  if (base.empty() || base == "C" || base == "POSIX") return {};
  const size_t underscore = base.find('_');
  std::string tag = base.substr(0, underscore);
  if (name.ends_with("@latin")) tag += "-Latn";
  if (name.ends_with("@cyrillic")) tag += "-Cyrl";
  if (underscore != std::string::npos) tag += "-" + base.substr(underscore + 1);
  return tag;
}

/// What ICU makes of a tag; nothing for what is no tag.
std::unique_ptr<icu::Locale> localeFromTag(const std::string& tag) {
  UErrorCode status = U_ZERO_ERROR;
  auto locale = std::make_unique<icu::Locale>(icu::Locale::forLanguageTag(tag, status));
  if (U_FAILURE(status) || locale->isBogus() || locale->getLanguage()[0] == '\0') return nullptr;
  return locale;
}

/// Which of `candidates` matches best; nothing when none does.
std::optional<size_t> bestMatch(const std::vector<std::string>& candidates, const icu::Locale& desired) {
  UErrorCode status = U_ZERO_ERROR;
  icu::LocaleMatcher::Builder builder;
  std::vector<size_t> indices;
  for (size_t i = 0; i < candidates.size(); ++i) {
    const auto locale = localeFromTag(candidates[i]);
    if (!locale) continue;
    builder.addSupportedLocale(*locale);
    indices.push_back(i);
  }
  if (indices.empty()) return std::nullopt;
  builder.setNoDefaultLocale();
  const icu::LocaleMatcher matcher = builder.build(status);
  if (U_FAILURE(status)) return std::nullopt;
  const auto result = matcher.getBestMatchResult(desired, status);
  const int32_t index = U_SUCCESS(status) ? result.getSupportedIndex() : -1;
  return index < 0 ? std::nullopt : std::optional(indices[static_cast<size_t>(index)]);
}

/// Without case and without marks above or below letters.
icu::UnicodeString folded(const std::string& text) {
  UErrorCode status = U_ZERO_ERROR;
  const icu::Normalizer2* decomposition = icu::Normalizer2::getNFDInstance(status);
  icu::UnicodeString source = icu::UnicodeString::fromUTF8(text).foldCase();
  if (U_FAILURE(status)) return source;
  const icu::UnicodeString decomposed = decomposition->normalize(source, status);
  if (U_FAILURE(status)) return source;
  icu::UnicodeString bare;
  for (int32_t i = 0; i < decomposed.length(); i = decomposed.moveIndex32(i, 1)) {
    const UChar32 c = decomposed.char32At(i);
    if (u_charType(c) != U_NON_SPACING_MARK) bare.append(c);
  }
  return bare;
}

}  // namespace

ICULocalization::ICULocalization(PreferenceStore& preferences, std::string preferenceDomain, Environment environment)
    : preferences_(preferences), preferenceDomain_(std::move(preferenceDomain)), environment_(std::move(environment)) {}

ICULocalization::Environment ICULocalization::processEnvironment() {
  return [](const char* name) -> std::string {
    const char* value = std::getenv(name);
    return value ? value : "";
  };
}

std::vector<std::string> ICULocalization::preferredLanguages() {
  std::vector<std::string> tags;
  const auto add = [&](std::string tag) {
    if (!tag.empty() && std::find(tags.begin(), tags.end(), tag) == tags.end()) tags.push_back(std::move(tag));
  };
  const Value languages = preferences_.valueForKey(preferenceDomain_, kLanguagesKey);
  for (const Value& tag : languages.asArray()) add(tag.asString());
  if (!tags.empty()) return tags;

  std::string locale;
  for (const char* name : {"LC_ALL", "LC_MESSAGES", "LANG"}) {
    if (locale.empty()) locale = environment_(name);
  }
  const std::string tag = tagFromLocaleName(locale);
  if (!tag.empty()) {
    // The list counts only where a language was chosen at all.
    const std::string list = environment_("LANGUAGE");
    for (size_t start = 0; start < list.size();) {
      const size_t end = std::min(list.find(':', start), list.size());
      add(tagFromLocaleName(list.substr(start, end - start)));
      start = end + 1;
    }
    add(tag);
  }
  if (tags.empty()) tags.emplace_back(kDefaultLanguage);
  return tags;
}

std::vector<std::string> ICULocalization::matchLocalizations(const std::vector<std::string>& available,
                                                             const std::vector<std::string>& preferred) {
  std::vector<std::string> remaining = available;
  std::vector<std::string> ordered;
  for (const std::string& tag : preferred) {
    const auto desired = localeFromTag(tag);
    if (!desired) continue;
    while (const auto index = bestMatch(remaining, *desired)) {
      const auto match = remaining.begin() + static_cast<ptrdiff_t>(*index);
      ordered.push_back(std::move(*match));
      remaining.erase(match);
    }
  }
  if (ordered.empty() && !available.empty()) {
    const bool hasDefault = std::find(available.begin(), available.end(), kDefaultLanguage) != available.end();
    ordered.push_back(hasDefault ? kDefaultLanguage : available.front());
  }
  return ordered;
}

std::string ICULocalization::formatDate(Date date, const std::string& pattern) {
  UErrorCode status = U_ZERO_ERROR;
  const auto language = localeFromTag(preferredLanguages().front());
  icu::Locale locale = language ? *language : icu::Locale(kDefaultLanguage);
  locale.setKeywordValue("calendar", "gregorian", status);
  locale.setKeywordValue("numbers", "latn", status);
  icu::SimpleDateFormat format(icu::UnicodeString::fromUTF8(pattern), locale, status);
  if (U_FAILURE(status)) return {};
  // Found anew each time: the user may have moved.
  format.adoptTimeZone(icu::TimeZone::detectHostTimeZone());
  icu::UnicodeString text;
  format.format(date.secondsSince1970 * 1000.0, text);
  std::string utf8;
  return text.toUTF8String(utf8);
}

bool ICULocalization::beginsWithFolded(const std::string& text, const std::string& prefix) {
  return folded(text).startsWith(folded(prefix));
}

}  // namespace qv::platform
