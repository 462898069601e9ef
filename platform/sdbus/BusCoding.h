#pragma once

#include <systemd/sd-bus.h>

#include <string>
#include <vector>

#include "platform/IPC.h"

namespace qv::platform::sdbus {

/// How much a message costs while it waits, by estimate.
struct MessageCost {
  size_t bytes = 0;
  size_t descriptors = 0;
};
MessageCost costOf(const IPCArguments& values);

/// How much memory one received message may become: its bytes and 64 for each value in it.
inline constexpr size_t kMaximumDecodedBytes = size_t{64} << 20;

/// Appends `values`, one for each of `signatures`. Answers 0 or a negative errno: writeForms's, or the message's. The
/// message is then incomplete and must not be sent.
int encodeArguments(sd_bus_message* message, const std::vector<std::string>& signatures, const IPCArguments& values);

/// Reads one value for each of `signatures` from a message of that signature. Answers 0 or a
/// negative errno: -EBADMSG for a malformed body, -ELOOP (kMaximumFormDepth) or -E2BIG for one beyond the bounds,
/// -EINVAL for types that have no Value, -EMFILE without descriptors of our own left.
int decodeArguments(sd_bus_message* message, const std::vector<std::string>& signatures, IPCArguments& values);

}  // namespace qv::platform::sdbus
