#include <utility>

#include "daemon/QVRecordingManager.h"
#include "support/QuorvelErrors.h"

namespace qv {

namespace {
constexpr uint32_t kRecordingBeginsSound = 1117;
constexpr uint32_t kRecordingEndsSound = 1118;
}  // namespace

/// Where the region, or a user who does not see the screen, asks for a sound.
void QVRecordingManager::checkAndPlaySystemRecordSound(const Session& session, bool isRecordingOn) {
  if (!session->isSystemRecording()) return;
  if (!platform_.deviceInfo->booleanProperty("RegionalBehaviorShutterClick") && !platform_.screenReader->isRunning()) {
    return;
  }
  platform_.sounds->play(isRecordingOn ? kRecordingBeginsSound : kRecordingEndsSound);
}

void QVRecordingManager::stopSystemRecordingWithHandler(const std::function<void(QVRecording&)>& end) {
  for (const Session& session : sessions_->systemRecordingSessions()) stopRecordingSession(session, end);
}

void QVRecordingManager::stopSystemRecordingWithInterruption() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    manager.stopSystemRecordingWithHandler([&manager](QVRecording& recording) {
      recording.end({.cause = recordingError(errorcode::kInterrupted),
                     .movie = manager.saveInPhotoLibrary(recording.settings().owner)});
    });
  });
}

void QVRecordingManager::notifySystemRecordingMayBeStopped() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    for (const Session& session : manager.sessions_->systemRecordingSessions()) {
      session->recording()->notifyRecordingMayBeStopped();
    }
  });
}

void QVRecordingManager::notifySystemRecordingResumed() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    for (const Session& session : manager.sessions_->systemRecordingSessions()) {
      session->recording()->notifyRecordingResumed();
    }
  });
}

}  // namespace qv
