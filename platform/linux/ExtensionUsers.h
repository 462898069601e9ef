#pragma once

#include <sys/types.h>

#include <map>
#include <mutex>
#include <set>
#include <string>

#include "platform/base/Result.h"

namespace qv::platform {

/// A range of user ids that nobody else on the device has.
struct UserRange {
  uid_t first;
  uid_t count;
};

/// Reserved when the daemon was built (QV_EXTENSION_FIRST_USER, QV_EXTENSION_USER_COUNT).
UserRange reservedUserRange();

/// Which extension runs as which user, where the daemon is root: two never share one. What was assigned stands in
/// `.users.json` of the containers' directory, and in the owners of the containers, which count where that file is
/// missing or damaged. A user is assigned anew only when all have been, its extension was not asked for since the
/// object was made, and its container is gone.
///
/// Threading: thread-safe, blocking.
class ExtensionUsers {
 public:
  explicit ExtensionUsers(std::string containers, UserRange range = reservedUserRange());
  /// That of an extension, by its identifier; the first time it is one that nobody has, and on the disk before this
  /// returns. ENOSPC where there is none.
  Result<uid_t> userOf(const std::string& extension);

 private:
  void load();
  void addFromFile();
  void addOwnersOfContainers();
  void add(const std::string& extension, uid_t user);
  Result<uid_t> assign(const std::string& extension);
  void forgetWithoutContainers();
  [[nodiscard]] std::optional<Error> save() const;

  const std::string containers_;
  const UserRange range_;
  std::mutex mutex_;
  bool isLoaded_ = false;
  std::map<std::string, uid_t> users_;
  std::set<uid_t> taken_;             ///< the values of `users_`
  std::set<std::string> askedFor_{};  ///< since the start
};

}  // namespace qv::platform
