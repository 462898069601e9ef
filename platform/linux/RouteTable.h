#pragma once

#include <sys/socket.h>

#include <cstdint>

namespace qv::platform {

/// The bits of platform/NetworkReachability.h for one address: what the kernel's routes say of a packet
/// to it. None is sent. Reachable where a route leads to the address; with a connection required where
/// the link of that route has no carrier. 0 as well for what is no address and where the kernel refuses.
///
/// Threading: thread-safe. The kernel answers at once.
[[nodiscard]] uint32_t reachabilityOfAddress(const sockaddr& address);

}  // namespace qv::platform
