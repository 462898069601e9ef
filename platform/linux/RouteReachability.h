#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/NetworkReachability.h"
#include "platform/threads/Executor.h"

namespace qv::platform {

/// The bits of a host, by its name; nothing where they cannot be told. Blocking.
using HostReachability = std::function<std::optional<uint32_t>(const std::string& host)>;

/// By name resolution and the kernel's routes, for as long as the resolver takes.
[[nodiscard]] uint32_t routeReachabilityOfHost(const std::string& host);

/// Reachability as name resolution and the kernel's routes tell it: the name must resolve, and a route
/// lead to one of its addresses. Nothing is sent to the host; the resolver may ask its name servers.
///
/// Where this process has no network, `ask` puts the question elsewhere.
///
/// A probe waits for the answer `patience` at most, and says then that its flags cannot be read. A
/// resolution that takes longer goes on alone on the executor; probes of the same host join it.
///
/// Threading: thread-safe.
class RouteReachabilityService final : public NetworkReachabilityService {
 public:
  static constexpr std::chrono::milliseconds kPatience{3000};
  explicit RouteReachabilityService(Executor& executor, std::chrono::milliseconds patience = kPatience,
                                    HostReachability ask = routeReachabilityOfHost);
  /// Null for what cannot be a host's name (RFC 1035: 253 characters at most).
  std::unique_ptr<NetworkReachabilityProbe> createProbe(const std::string& host) override;

 private:
  struct State;
  class Probe;
  const std::shared_ptr<State> state_;
};

}  // namespace qv::platform
