#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace qv::platform {

/// Bits of a probe's answer.
namespace reachability {
inline constexpr uint32_t kReachable = 2;
/// Only after a connection is made first, which nothing here does: there is a route, but its link is down.
inline constexpr uint32_t kConnectionRequired = 4;
}  // namespace reachability

/// Whether one host could be reached, as far as can be told without talking to it.
///
/// Threading: one thread at a time.
class NetworkReachabilityProbe {
 public:
  virtual ~NetworkReachabilityProbe() = default;
  /// The bits above; nothing where they cannot be read. Blocks, for a few seconds at most.
  virtual std::optional<uint32_t> flags() = 0;
};

/// Threading: thread-safe.
class NetworkReachabilityService {
 public:
  virtual ~NetworkReachabilityService() = default;
  /// Null where no probe can be made for such a name.
  virtual std::unique_ptr<NetworkReachabilityProbe> createProbe(const std::string& host) = 0;
};

}  // namespace qv::platform
