#include "support/QVStoreInfo.h"

namespace qv {
namespace {

std::string joined(const std::vector<std::string>& parts) {
  std::string text;
  for (const std::string& part : parts) {
    if (&part != &parts.front()) text += ",";
    text += part;
  }
  return text;
}

}  // namespace

platform::Dictionary QVStoreInfo::dictionary() const {
  platform::Dictionary dictionary;
  const auto add = [&](const char* key, const std::optional<std::string>& field) {
    if (field) dictionary[key] = platform::Value(*field);
  };
  add("QVStoreInfoBundleIDKey", bundleID);
  add("QVStoreInfoAppNameKey", appName);
  add("QVStoreInfoAuthorKey", author);
  add("QVStoreInfoItemURLKey", itemURL);
  if (categories && !categories->empty()) add("QVStoreInfoCategoriesKey", joined(*categories));
  return dictionary;
}

}  // namespace qv
