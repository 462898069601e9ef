#include "platform/linux/JSONPreferenceStore.h"

#include <cerrno>

#include "platform/linux/Json.h"
#include "platform/linux/SmallFile.h"
#include "platform/threads/Log.h"

namespace qv::platform {

Value JSONPreferenceStore::valueForKey(const std::string& domain, const std::string& key) {
  if (!isSafeFileStem(domain)) return {};
  const std::string path = directory_ + "/" + domain + ".json";
  const auto preferences = readJSONDictionary(path);
  if (preferences) return platform::valueForKey(preferences.value(), key);
  if (preferences.error().code != ENOENT) {
    QV_LOG_ERROR(logs::kPlatform, "preferences %s: %s", path.c_str(), preferences.error().description().c_str());
  }
  return {};
}

}  // namespace qv::platform
