#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/base/Error.h"

namespace qv::platform {

/// Which facts of an item are asked for.
enum class StoreKeyProfile { Product };

/// A question to the store's catalogue.
struct StoreLookupRequest {
  StoreKeyProfile keyProfile = StoreKeyProfile::Product;
  /// 1: names in the user's language where the catalogue has them.
  int32_t localizationStyle = 1;
  std::vector<std::string> bundleIdentifiers;
};

/// What the catalogue knows of one item: plain texts in UTF-8, of bounded length and without control
/// characters, whatever stands in the catalogue.
struct StoreLookupResult {
  std::optional<std::string> shortProductURL;
  std::optional<std::string> displayName;
  std::optional<std::string> artistName;
  std::optional<std::vector<std::string>> genreNames;
};

/// Results in the order of the request's identifiers; what is not in the catalogue is left out.
struct StoreLookupResponse {
  std::vector<StoreLookupResult> results;
};

/// The catalogue of the device's application store.
///
/// Threading: thread-safe.
class StoreLookupService {
 public:
  using Handler = std::function<void(const StoreLookupResponse&, const std::optional<Error>&)>;
  virtual ~StoreLookupService() = default;
  /// Returns at once. The handler is called once, on a thread of the service's.
  virtual void start(const StoreLookupRequest& request, Handler handler) = 0;
};

}  // namespace qv::platform
