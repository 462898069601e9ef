#pragma once

namespace qv {

/// Whether the network is there.
///
/// Threading: thread-safe.
class QVReachability {
 public:
  QVReachability() = delete;
  /// Whether a well-known public web host could be reached now, without making a connection first. Nothing
  /// is sent to that host. Blocks, for a few seconds at most; any failure is a no.
  [[nodiscard]] static bool isNetworkAvailable();
};

}  // namespace qv
