#include "support/QVBundleTexts.h"

#include <string_view>
#include <utility>

#include "platform/threads/Log.h"
#include "support/StringsTable.h"

namespace qv {
namespace {

using platform::Bundle;
using platform::BundleRef;
using platform::Value;
namespace bundleinfo = platform::bundleinfo;

constexpr const char kFrameworkPath[] = "/System/Library/Frameworks/Quorvel.framework";
constexpr const char kTableName[] = "Localizable";
constexpr const char kTableType[] = "strings";
constexpr const char kDevelopmentRegionKey[] = "CFBundleDevelopmentRegion";
constexpr const char kDefaultLocalization[] = "en";
constexpr const char kIconSuffix[] = ".png";

std::optional<std::string> text(const platform::Dictionary& dictionary, std::string_view key) {
  const Value* value = platform::find(dictionary, key);
  const auto* string = value ? value->getIf<std::string>() : nullptr;
  return string ? std::optional(*string) : std::nullopt;
}

}  // namespace

BundleRef QVBundleTexts::_qvFrameworkBundle() const {
  return framework_.with([this](BundleRef& bundle) {
    if (!bundle) bundle = platform_.bundles->bundleAtPath(platform_.deviceRoot + kFrameworkPath);
    return bundle;
  });
}

/// The key itself where the bundle has no table or the table lacks it.
std::string QVBundleTexts::stringInTable(const Bundle& bundle, const std::string& localization,
                                         const std::string& key) const {
  const auto path = bundle.pathForResource(kTableName, kTableType, localization);
  if (!path) return key;
  const auto content = platform_.fileSystem->readFile(*path);
  if (!content) {
    QV_LOG_ERROR(platform::logs::kSupport, "%s: %s", path->c_str(), content.error().description().c_str());
    return key;
  }
  const StringsTable table = parseStringsTable(content.value());
  if (table.fault) QV_LOG_ERROR(platform::logs::kSupport, "%s: %s", path->c_str(), table.fault->c_str());
  const auto entry = table.texts.find(key);
  return entry == table.texts.end() ? key : entry->second;
}

std::optional<std::string> QVBundleTexts::_qvLocalizedStringFromFrameworkBundleWithKey(const std::string& key) const {
  if (const BundleRef bundle = localizedBundle()) return stringInTable(*bundle, {}, key);
  if (const BundleRef bundle = fallbackBundle()) return stringInTable(*bundle, {}, key);
  const BundleRef framework = _qvFrameworkBundle();
  if (!framework) return std::nullopt;
  return stringInTable(*framework,
                       text(framework->infoDictionary(), kDevelopmentRegionKey).value_or(kDefaultLocalization), key);
}

std::string QVBundleTexts::localizedText(const std::string& key) const {
  return _qvLocalizedStringFromFrameworkBundleWithKey(key).value_or(key);
}

BundleRef QVBundleTexts::localizedBundle() const {
  const BundleRef framework = _qvFrameworkBundle();
  if (!framework) return nullptr;
  platform::Localization& localization = *platform_.localization;
  const auto matches = localization.matchLocalizations(framework->localizations(), localization.preferredLanguages());
  if (matches.empty()) return nullptr;
  return platform_.bundles->bundleAtPath(framework->resourcePath() + "/" + matches.front() + ".lproj");
}

BundleRef QVBundleTexts::fallbackBundle() const {
  const BundleRef framework = _qvFrameworkBundle();
  const auto languages = platform_.localization->preferredLanguages();
  if (!framework || languages.empty()) return nullptr;
  const std::string language = languages.front().substr(0, languages.front().find('-'));
  const auto table = framework->pathForResource(kTableName, kTableType, language);
  return table ? platform_.bundles->bundleAtPath(table->substr(0, table->rfind('/'))) : nullptr;
}

std::string QVBundleTexts::_qvLocalizedAppName(const Bundle& bundle) {
  if (auto name = text(bundle.localizedInfoDictionary(), bundleinfo::kDisplayName)) return *name;
  if (auto name = text(bundle.infoDictionary(), bundleinfo::kDisplayName)) return *name;
  return text(bundle.infoDictionary(), bundleinfo::kName).value_or("");
}

std::optional<std::string> QVBundleTexts::_qvLocalizedAppNameFromBundleID(const std::string& bundleID) const {
  const BundleRef bundle = platform_.bundles->bundleWithIdentifier(bundleID);
  return bundle ? std::optional(_qvLocalizedAppName(*bundle)) : std::nullopt;
}

platform::Data QVBundleTexts::_qvAppIconFromBundleID(const std::string& bundleID) const {
  const BundleRef bundle = platform_.bundles->bundleWithIdentifier(bundleID);
  auto name = bundle ? text(bundle->infoDictionary(), bundleinfo::kIconFile) : std::nullopt;
  if (!name) return {};
  if (name->ends_with(kIconSuffix)) name->resize(name->size() - std::string_view(kIconSuffix).size());
  // A name, not a way out of the bundle.
  const bool isName = name->find('/') == std::string::npos;
  const auto path = isName ? bundle->pathForResource(*name, "png", {}) : std::nullopt;
  const auto content = path ? platform_.fileSystem->readFile(*path) : platform::Result<std::string>(std::string());
  return content ? platform::Data(content.value().begin(), content.value().end()) : platform::Data();
}

BundleRef QVBundleTexts::bundleWithPID(pid_t pid) const {
  platform::BundleService& bundles = *platform_.bundles;
  const auto path = bundles.executablePathOfProcess(pid);
  return path ? bundles.bundleEnclosingExecutable(*path) : nullptr;
}

std::string QVBundleTexts::baseIdentifier(const std::string& identifier) {
  const size_t dot = identifier.rfind('.');
  return dot == std::string::npos ? std::string() : identifier.substr(0, dot);
}

}  // namespace qv
