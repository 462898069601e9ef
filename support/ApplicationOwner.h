#pragma once

#include <sys/types.h>

#include <string>

namespace qv {

/// Under what everything is kept that outlives an application's connection and is nobody else's: finished movies,
/// broadcasts that were set up, what the user has allowed. An application is its bundle and the user that runs it: the
/// same program under another user is another application, and inherits nothing.
[[nodiscard]] inline std::string applicationOwner(const std::string& bundleID, uid_t user) {
  return bundleID + ":" + std::to_string(user);
}

}  // namespace qv
