#pragma once

#include <sys/types.h>

#include <string>

#include "platform/base/Value.h"

namespace qv::platform {

/// What applications may do beyond the ordinary.
///
/// Threading: thread-safe, blocking (small files).
class EntitlementQuery {
 public:
  virtual ~EntitlementQuery() = default;
  /// Of a bundle that this user runs; empty where there are none.
  [[nodiscard]] virtual Dictionary entitlementsForBundle(const std::string& bundleIdentifier, uid_t user) const = 0;
};

}  // namespace qv::platform
