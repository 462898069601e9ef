#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/IPC.h"
#include "support/ApplicationOwner.h"

namespace qv {

/// Of the device's own clients: recordings of the whole screen, and what else is not for everybody.
inline constexpr const char kSystemClientEntitlement[] = "com.tarnwick.private.quorvel";

/// Who makes a request.
///
/// Threading: a value; of the sequence.
struct Caller {
  std::shared_ptr<platform::IPCConnection> connection;

  [[nodiscard]] const std::optional<std::string>& bundleID() const { return connection->peer().bundleIdentifier; }
  [[nodiscard]] bool is(const std::string& id) const { return bundleID() == id; }
  [[nodiscard]] uid_t user() const { return connection->peer().userIdentifier; }
  /// Under what its movies and the like are kept; empty for a process of no bundle.
  [[nodiscard]] std::string owner() const { return bundleID() ? applicationOwner(*bundleID(), user()) : std::string(); }
  /// What it is now, compared with what it was when it connected.
  [[nodiscard]] platform::PeerStanding standing() const { return connection->peer().standing(); }
  /// One of the system's own clients.
  [[nodiscard]] bool isPrivileged() const { return connection->valueForEntitlement(kSystemClientEntitlement).asBool(); }
};

}  // namespace qv
