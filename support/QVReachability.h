#pragma once

#include "platform/NetworkReachability.h"

namespace qv {

/// Whether the network is there. Offered, not called by this daemon.
///
/// Threading: thread-safe.
class QVReachability {
 public:
  explicit QVReachability(platform::NetworkReachabilityService& service) : service_(service) {}
  /// Whether a well-known public web host could be reached now, without making a connection first. Nothing
  /// is sent to that host. Blocks, for a few seconds at most; any failure is a no.
  [[nodiscard]] bool isNetworkAvailable();

 private:
  platform::NetworkReachabilityService& service_;
};

}  // namespace qv
