#pragma once

#include <chrono>

#include "platform/pulse/PulseConnection.h"

namespace qv::platform {

/// A short visit to the sound server, in the calling thread and with an end in time.
///
/// Threading: one thread.
class PulseSession {
 public:
  /// The session as a whole ends after `limit`.
  PulseSession(const std::string& server, std::chrono::milliseconds limit);

  /// Whether the server answered.
  [[nodiscard]] bool isConnected() const { return connected_; }
  [[nodiscard]] pa_context* context() const { return context_.get(); }
  /// Handles events until `done` holds; false when the time is over or the connection is lost.
  bool runUntil(const std::function<bool()>& done);

 private:
  bool connect(const std::string& server);

  const std::chrono::steady_clock::time_point end_;
  const PulsePointer<pa_mainloop> loop_;
  const PulsePointer<pa_context> context_;
  const bool connected_;
};

/// Whether the server has a microphone now.
bool serverHasMicrophone(const std::string& server);

}  // namespace qv::platform
