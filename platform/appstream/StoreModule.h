#pragma once

#include <string>
#include <vector>

#include "platform/StoreLookup.h"
#include "platform/process/LateModule.h"

namespace qv::platform::appstream {

/// Looking into the catalogue needs GLib and an XML library, so it stands in a module of its own.
inline constexpr const char kStoreModule[] = "quorveld-store.so";

/// One look into the catalogue. `languages`: BCP 47 tags, most preferred first.
using LookUpInCatalogue = void (*)(const std::string& deviceRoot, const std::vector<std::string>& languages,
                                   const StoreLookupRequest& request, Result<StoreLookupResponse>& answer);
inline constexpr const char kStoreModuleEntry[] = "qvLookUpInCatalogue";

}  // namespace qv::platform::appstream
