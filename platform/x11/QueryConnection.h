#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>

#include "platform/x11/XcbConnection.h"

namespace qv::platform {

/// The connection for single questions, shared by all who ask. It sleeps between questions, and
/// is made anew at the next question after the server went away and came back.
///
/// Threading: thread-safe; questions wait for each other.
class QueryConnection {
 public:
  explicit QueryConnection(std::string display);
  /// Fails when the display does not answer.
  std::optional<Error> connect();
  [[nodiscard]] const std::string& display() const { return display_; }

  /// `question(connection)`, or `fallback` when there is no server. A question that met with the
  /// loss of an old connection is asked once more on a new one.
  template <typename T, typename Question>
  T ask(T fallback, const Question& question) {
    std::lock_guard lock(mutex_);
    const ScopedSigpipeBlock noSigpipe;
    for (int attempt = 0; attempt < 2; ++attempt) {
      if (!ensureConnected()) return fallback;
      drainEvents();
      T answer = question(*connection_);
      if (!connection_->isLost()) return answer;
    }
    return fallback;
  }

 private:
  bool ensureConnected();
  void drainEvents();

  const std::string display_;
  std::mutex mutex_;
  std::unique_ptr<XcbConnection> connection_;
};

}  // namespace qv::platform
