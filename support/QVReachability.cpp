#include "support/QVReachability.h"

namespace qv {

namespace reachability = platform::reachability;

namespace {
/// Reserved for such uses (RFC 2606), and served all over the world.
constexpr const char kProbeHost[] = "www.example.com";
}  // namespace

bool QVReachability::isNetworkAvailable() {
  const auto probe = service_.createProbe(kProbeHost);
  const auto flags = probe ? probe->flags() : std::nullopt;
  if (!flags) return false;
  return (*flags & reachability::kReachable) != 0 && (*flags & reachability::kConnectionRequired) == 0;
}

}  // namespace qv
