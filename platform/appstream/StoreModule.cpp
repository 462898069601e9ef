#include "platform/appstream/StoreModule.h"

#include "platform/appstream/Catalogue.h"

using namespace qv::platform;

QV_MODULE_DEFINE_ABI;

QV_MODULE_EXPORT void qvLookUpInCatalogue(const std::string& deviceRoot, const std::vector<std::string>& languages,
                                          const StoreLookupRequest& request, Result<StoreLookupResponse>& answer) {
  answer = appstream::lookUpInCatalogue(deviceRoot, languages, request);
}
