#include "daemon/QVRecordingManager.h"

namespace qv {

using platform::Error;

platform::SerialQueue& QVRecordingManager::quorvelAlertQueue() {
  if (!alertQueue_) {
    alertQueue_ = std::make_unique<platform::SerialQueue>("com.quorvel.alertQueue", *platform_.globalQueue);
  }
  return *alertQueue_;
}

/// A system recording has no application that could tell its user why it ended.
void QVRecordingManager::alertUserOfEnd(const Session& session, const std::optional<Error>& error) {
  if (!session->isSystemRecording()) return;
  const bool isBroadcast = session->hasBroadcastExtension();
  quorvelAlertQueue().async([session, isBroadcast, error] {
    (void)(isBroadcast ? showAlertForBroadcastSession(session, error) : showAlertForRecordingSession(session, error));
  });
}

bool QVRecordingManager::showAlertForRecordingSession(const Session&, const std::optional<Error>&) { return true; }

bool QVRecordingManager::showAlertForBroadcastSession(const Session&, const std::optional<Error>&) { return true; }

bool QVRecordingManager::showResumeBroadcastAlert(const Session&, uint32_t) { return true; }

bool QVRecordingManager::showStopRecordingAlert() { return true; }

}  // namespace qv
