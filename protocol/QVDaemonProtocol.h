#pragma once

#include "platform/IPC.h"

namespace qv {

/// The named service of the daemon.
inline constexpr const char kServiceName[] = "com.tarnwick.quorveld";

/// What clients call on the daemon. The members are the operations' first keywords; their
/// arguments are in docs/protocol.md.
const platform::IPCInterface& daemonProtocol();

}  // namespace qv
