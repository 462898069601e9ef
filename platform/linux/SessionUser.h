#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

namespace qv::platform {

/// The number of a user who is named as in /etc/passwd, or by that number; nothing where there is none. No other source
/// of names is asked: one of those may be slow.
[[nodiscard]] std::optional<uid_t> userNamed(const std::string& name);

/// Whose television session it is: this process's user. A process of root serves the user whom QUORVEL_SESSION_USER
/// names, and without it root alone.
[[nodiscard]] uid_t sessionUserFromEnvironment();

}  // namespace qv::platform
