#pragma once

#include <sys/types.h>

#include <string>

#include "platform/Entitlements.h"

namespace qv::platform {

/// What applications may do beyond the ordinary, one JSON dictionary for each bundle identifier:
/// <device root>/etc/quorvel/entitlements/<bundle identifier>.json.
///
/// A file counts only when it is a regular file that belongs to root or to this process's user, in a
/// directory that does too, and neither can be written by group or others; any other is logged and
/// grants nothing.
///
/// A file holds for some users only. Its entry "users", an array, lists all of them: numbers, names as in /etc/passwd,
/// and "session" for the session's user. Without it these are the session's user and root. An entry that is nobody is
/// logged; "users" of another type is too, and then the file grants nothing.
///
/// Threading: thread-safe, blocking.
class EntitlementStore final : public EntitlementQuery {
 public:
  EntitlementStore(const std::string& deviceRoot, uid_t sessionUser);
  /// Without "users".
  [[nodiscard]] Dictionary entitlementsForBundle(const std::string& bundleIdentifier, uid_t user) const override;

 private:
  [[nodiscard]] Dictionary read(const std::string& bundleIdentifier) const;
  [[nodiscard]] bool isFor(uid_t user, const Dictionary& file, const std::string& bundleIdentifier) const;

  const std::string directory_;
  const uid_t sessionUser_;
};

}  // namespace qv::platform
