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

void QVRecordingManager::stopSystemRecordingWithHandler(const std::function<RecordingEnd(const Session&)>& endOf) {
  for (const Session& session : sessions_->systemRecordingSessions()) stopRecordingSession(session, endOf(session));
}

void QVRecordingManager::stopSystemRecordingWithInterruption() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    manager.stopSystemRecordingWithHandler([handover = manager.handover_](const Session& session) {
      RecordingEnd end{.cause = _qvUserErrorForCode(errorcode::kInterrupted)};
      end.movie = [handover, bundleID = session->bundleID()](std::shared_ptr<MovieClaim> movie, auto done) {
        handover->saveInterrupted(movie, bundleID, [done](const auto& kept, const auto&) { done(kept); });
      };
      return end;
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
