#pragma once

#include "platform/IPC.h"

namespace qv {

/// What the daemon calls on a client. All operations are one-way.
const platform::IPCInterface& clientProtocol();

}  // namespace qv
