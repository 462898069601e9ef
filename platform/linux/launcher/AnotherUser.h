#pragma once

#include <sys/types.h>

#include <string>

namespace qv::platform::launcher {

/// The user that an extension of a root daemon runs as, who has nothing but its container. The container is handed
/// over, and in a mount namespace of its own the extension sees no other of the device's data, and everything but the
/// container read-only. Call before anything is opened by path. Throws std::system_error.
///
/// Threading: the launcher has one thread.
class AnotherUser {
 public:
  struct View {
    std::string dataDirectory, container;
    /// Whether the namespace may be missing, where the daemon has no right to make one and Landlock hides the data.
    bool isOptional;
  };
  AnotherUser(uid_t user, const View& view);
  /// Gives up root for good. Throws std::system_error.
  void become() const;

 private:
  uid_t user_;
};

/// So that no program that is executed gains a capability. That takes one itself: call while still root.
void emptyBoundingSet();

/// Gives up every capability. Throws std::system_error.
void dropCapabilities();

}  // namespace qv::platform::launcher
