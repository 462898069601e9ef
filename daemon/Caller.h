#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/IPC.h"

namespace qv {

/// Who makes a request.
///
/// Threading: a value; of the sequence.
struct Caller {
  std::shared_ptr<platform::IPCConnection> connection;

  [[nodiscard]] const std::optional<std::string>& bundleID() const { return connection->peer().bundleIdentifier; }
  [[nodiscard]] bool is(const std::string& id) const { return bundleID() == id; }
  /// One of the system's own clients.
  [[nodiscard]] bool isPrivileged() const {
    return connection->valueForEntitlement("com.tarnwick.private.quorvel").asBool();
  }
};

}  // namespace qv
