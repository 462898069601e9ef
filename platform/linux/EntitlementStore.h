#pragma once

#include <string>

#include "platform/base/Value.h"

namespace qv::platform {

/// What applications may do beyond the ordinary, one JSON dictionary for each bundle identifier:
/// <device root>/etc/quorvel/entitlements/<bundle identifier>.json.
///
/// A file counts only when it is a regular file that belongs to root or to this process's user, in a
/// directory that does too, and neither can be written by group or others; any other is logged and
/// grants nothing.
///
/// Threading: thread-safe, blocking.
class EntitlementStore {
 public:
  explicit EntitlementStore(const std::string& deviceRoot);
  /// Empty where there are none.
  [[nodiscard]] Dictionary entitlementsForBundle(const std::string& bundleIdentifier) const;

 private:
  const std::string directory_;
};

}  // namespace qv::platform
