#pragma once

#include <string>

#include "platform/IPC.h"

namespace qv::platform::sdbus {

// D-Bus errors of this system; the others are those of D-Bus itself.
inline constexpr const char kNoReplyError[] = "com.tarnwick.quorveld.Error.NoReply";
inline constexpr const char kInvalidReplyError[] = "com.tarnwick.quorveld.Error.InvalidReply";

inline Error ipcError(IPCErrorCode code, const std::string& text) {
  return {kIPCErrorDomain, static_cast<int64_t>(code), {{kLocalizedDescriptionKey, Value(text)}}};
}

}  // namespace qv::platform::sdbus
