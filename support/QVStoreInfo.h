#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/base/Value.h"

namespace qv {

/// What the store says of one application.
struct QVStoreInfo {
  std::optional<std::string> bundleID;
  std::optional<std::string> appName;
  std::optional<std::string> author;
  std::optional<std::string> itemURL;  ///< the short link to the application's page in the store
  std::optional<std::vector<std::string>> categories;

  /// Under "QVStoreInfo...Key" the fields that are present; the categories, where there are any, as one
  /// text with "," between them.
  [[nodiscard]] platform::Dictionary dictionary() const;
};

}  // namespace qv
