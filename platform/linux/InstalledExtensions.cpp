#include "platform/linux/InstalledExtensions.h"

#include <set>
#include <string>
#include <utility>

#include "platform/linux/ExtensionManifest.h"
#include "platform/threads/Log.h"

namespace qv::platform {

std::vector<ExtensionRecordRef> installedExtensions(LinuxBundleService& bundles) {
  std::vector<ExtensionRecordRef> extensions;
  std::set<std::string> identifiers;
  for (const BundleRef& bundle : bundles.installedBundles()) {
    if (!isExtensionInfo(bundle->infoDictionary())) continue;
    auto record = makeExtensionRecord(*bundle);
    if (!record) {
      QV_LOG_ERROR(logs::kExtensions, "extension %s is left out: %s", bundle->path().c_str(),
                   record.error().description().c_str());
    } else if (!identifiers.insert((*record)->identifier).second) {
      QV_LOG_ERROR(logs::kExtensions, "extension %s is left out: another one is %s", bundle->path().c_str(),
                   (*record)->identifier.c_str());
    } else {
      extensions.push_back(std::move(*record));
    }
  }
  return extensions;
}

}  // namespace qv::platform
