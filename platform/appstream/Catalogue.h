#pragma once

#include <string>
#include <vector>

#include "platform/StoreLookup.h"
#include "platform/base/Result.h"

namespace qv::platform::appstream {

/// Looks into the catalogues below the device root, as told in AppStreamStore.h. `languages`: BCP 47 tags, most
/// preferred first; none for the untranslated texts. An error where no catalogue is installed.
///
/// Threading: one thread at a time. Blocking: reads the catalogue, or the cache that libappstream keeps of it.
Result<StoreLookupResponse> lookUpInCatalogue(const std::string& deviceRoot, const std::vector<std::string>& languages,
                                              const StoreLookupRequest& request);

}  // namespace qv::platform::appstream
