#pragma once

#include <string>

namespace qv::platform::launcher {

/// Where Landlock alone does not confine and the launcher is root: what the extension may see of the device's data is
/// its container, mounted over an empty `dataDirectory` in a mount namespace of its own, and it is to run as a user
/// that owns nothing but that container. The user's id is made from the container's name, above all that are given
/// out. Call before anything is opened by path. Throws std::system_error.
///
/// Threading: the launcher has one thread.
class AnotherUser {
 public:
  AnotherUser(const std::string& dataDirectory, const std::string& container);
  /// Gives up root for good. Throws std::system_error.
  void become() const;

 private:
  unsigned userIdentifier_;
};

/// Gives up every capability for good, where the user stays the same. Throws std::system_error.
void dropCapabilities();

}  // namespace qv::platform::launcher
