#include "support/QVStoreManager.h"

#include <utility>

#include "platform/Platform.h"
#include "support/QVBundleTexts.h"

namespace qv {

using platform::Platform;
using platform::StoreLookupResponse;
using platform::StoreLookupResult;

namespace {

QVStoreInfo infoFrom(const StoreLookupResponse& response, const std::string& bundleIdentifier) {
  const StoreLookupResult result = response.results.empty() ? StoreLookupResult() : response.results.front();
  QVStoreInfo info;
  info.bundleID = bundleIdentifier;
  info.itemURL = result.shortProductURL.value_or("");
  info.appName = result.displayName ? result.displayName : _qvLocalizedAppNameFromBundleID(bundleIdentifier);
  info.author = result.artistName.value_or("");
  info.categories = result.genreNames;
  return info;
}

}  // namespace

QVStoreManager& QVStoreManager::sharedManager() {
  static QVStoreManager manager;
  return manager;
}

void QVStoreManager::loadItemDetailsForBundleIdentifier(const std::string& bundleIdentifier,
                                                        std::function<void(const QVStoreInfo&)> completionHandler) {
  platform::StoreLookupRequest request;
  request.bundleIdentifiers = {bundleIdentifier};
  // A lookup that failed has no results; the error says nothing more to the one who waits.
  Platform::current().storeLookup->start(request, [bundleIdentifier, completion = std::move(completionHandler)](
                                                      const StoreLookupResponse& response, const auto&) {
    Platform::current().mainQueue->async(
        [info = infoFrom(response, bundleIdentifier), completion] { completion(info); });
  });
}

}  // namespace qv
