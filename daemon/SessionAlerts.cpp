#include "daemon/SessionAlerts.h"

namespace qv {

using platform::Error;

platform::SerialQueue& SessionAlerts::quorvelAlertQueue() {
  if (!alertQueue_) alertQueue_ = std::make_unique<platform::SerialQueue>("com.quorvel.alertQueue", executor_);
  return *alertQueue_;
}

void SessionAlerts::alertUserOfEnd(const Session& session, const std::optional<Error>& error) {
  if (!session->isSystemRecording()) return;
  const bool isBroadcast = session->recording() && session->recording()->settings().broadcast;
  quorvelAlertQueue().async([session, isBroadcast, error] {
    (void)(isBroadcast ? showAlertForBroadcastSession(session, error) : showAlertForRecordingSession(session, error));
  });
}

bool SessionAlerts::showAlertForRecordingSession(const Session&, const std::optional<Error>&) { return true; }

bool SessionAlerts::showAlertForBroadcastSession(const Session&, const std::optional<Error>&) { return true; }

bool SessionAlerts::showResumeBroadcastAlert(const Session&, uint32_t) { return true; }

}  // namespace qv
