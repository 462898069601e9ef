#pragma once

#include <memory>
#include <optional>

#include "platform/threads/SerialQueue.h"
#include "session/QVRecordingSession.h"

namespace qv {

/// Alerts about recordings that ended or wait: places for a device that shows them. Here they present nothing, and
/// answer true.
///
/// Threading: sequence only; what is shown is shown on the alert queue.
class SessionAlerts {
 public:
  using Session = std::shared_ptr<QVRecordingSession>;
  explicit SessionAlerts(platform::Executor& executor) : executor_(executor) {}

  /// A system recording has no application that could tell its user why it ended.
  void alertUserOfEnd(const Session& session, const std::optional<platform::Error>& error);
  static bool showResumeBroadcastAlert(const Session& session, uint32_t contextID);

 private:
  /// Made when it is first used.
  [[nodiscard]] platform::SerialQueue& quorvelAlertQueue();
  static bool showAlertForRecordingSession(const Session& session, const std::optional<platform::Error>& error);
  static bool showAlertForBroadcastSession(const Session& session, const std::optional<platform::Error>& error);

  platform::Executor& executor_;
  std::unique_ptr<platform::SerialQueue> alertQueue_;
};

}  // namespace qv
