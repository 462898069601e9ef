#pragma once

#include <chrono>
#include <memory>
#include <string>

#include "platform/NetworkReachability.h"
#include "platform/threads/Executor.h"

namespace qv::platform {

/// Reachability as name resolution and the kernel's routes tell it: the name must resolve, and a route
/// lead to one of its addresses. Nothing is sent to the host; the resolver may ask its name servers.
///
/// A probe waits for the resolver `patience` at most, and says then that its flags cannot be read. A
/// resolution that takes longer goes on alone on the executor; probes of the same host join it.
///
/// Threading: thread-safe.
class RouteReachabilityService final : public NetworkReachabilityService {
 public:
  static constexpr std::chrono::milliseconds kPatience{3000};
  explicit RouteReachabilityService(Executor& executor, std::chrono::milliseconds patience = kPatience);
  /// Null for what cannot be a host's name (RFC 1035: 253 characters at most).
  std::unique_ptr<NetworkReachabilityProbe> createProbe(const std::string& host) override;

 private:
  struct State;
  class Probe;
  const std::shared_ptr<State> state_;
};

}  // namespace qv::platform
