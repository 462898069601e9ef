#include "support/QVStoreManager.h"

#include <utility>

namespace qv {

using platform::StoreLookupResponse;
using platform::StoreLookupResult;

namespace {

QVStoreInfo infoFrom(const StoreLookupResponse& response, const std::string& bundleIdentifier,
                     const QVBundleTexts& texts) {
  const StoreLookupResult result = response.results.empty() ? StoreLookupResult() : response.results.front();
  QVStoreInfo info;
  info.bundleID = bundleIdentifier;
  info.itemURL = result.shortProductURL.value_or("");
  info.appName = result.displayName ? result.displayName : texts._qvLocalizedAppNameFromBundleID(bundleIdentifier);
  info.author = result.artistName.value_or("");
  info.categories = result.genreNames;
  return info;
}

}  // namespace

void QVStoreManager::loadItemDetailsForBundleIdentifier(const std::string& bundleIdentifier,
                                                        std::function<void(const QVStoreInfo&)> completionHandler) {
  platform::StoreLookupRequest request;
  request.bundleIdentifiers = {bundleIdentifier};
  // A lookup that failed has no results; the error says nothing more to the one who waits.
  storeLookup_.start(
      request, [&texts = texts_, &mainQueue = mainQueue_, bundleIdentifier, completion = std::move(completionHandler)](
                   const StoreLookupResponse& response, const auto&) {
        mainQueue.async([info = infoFrom(response, bundleIdentifier, texts), completion] { completion(info); });
      });
}

}  // namespace qv
