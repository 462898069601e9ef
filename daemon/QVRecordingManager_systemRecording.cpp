#include "daemon/QVRecordingManager.h"
#include "platform/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
namespace logs = platform::logs;

namespace {
constexpr uint32_t kRecordingBeginsSound = 1117;
constexpr uint32_t kRecordingEndsSound = 1118;
}  // namespace

void QVRecordingManager::clearSystemRecordingUI(const Session& session) {
  if (!session->isSystemRecording()) return;
  QV_LOG(logs::kDaemon, "stop monitoring foreground apps");
  // A late end must not take away the follower of the next recording.
  if (followedSession_ != session) return;
  followedSession_.reset();
  applicationStateMonitor_->setHandler(nullptr);
}

/// Where the region, or a user who does not see the screen, asks for a sound.
void QVRecordingManager::checkAndPlaySystemRecordSound(const Session& session, bool isRecordingOn) {
  if (!session->isSystemRecording()) return;
  if (!platform_.deviceInfo->booleanProperty("RegionalBehaviorShutterClick") && !platform_.screenReader->isRunning()) {
    return;
  }
  platform_.sounds->play(isRecordingOn ? kRecordingBeginsSound : kRecordingEndsSound);
}

std::vector<QVRecordingManager::Session> QVRecordingManager::runningSystemRecordings() const {
  std::vector<Session> running;
  for (const auto& [bundleID, session] : bundleIDToRecordingSessionLookup_) {
    if (session->isSystemRecording() && session->isRecording()) running.push_back(session);
  }
  return running;
}

/// The handler is called once for each, and not at all where none runs.
void QVRecordingManager::stopSystemRecordingWithHandler(const SystemStopHandler& handler) {
  for (const Session& session : runningSystemRecordings()) {
    stopRecordingSession(session, 0, 0,
                         [session, handler](const auto& movie, const auto& error) { handler(movie, error, session); });
  }
}

void QVRecordingManager::stopSystemRecordingWithInterruption() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    manager.stopSystemRecordingWithHandler(
        [weakSelf = manager.weak_from_this()](const auto& movie, const auto&, const Session& session) {
          const auto self = weakSelf.lock();
          if (!self) return;
          if (movie) {
            self->saveMovie(*movie, [](const std::optional<Error>& error) {
              if (error) QV_LOG_ERROR(logs::kDaemon, "error saving file with code: %i", static_cast<int>(error->code));
            });
          }
          // Its generation is still this recording's: a next one waits until this end is complete.
          self->tellRecordingEnded(session, {session->generation(), _qvUserErrorForCode(errorcode::kInterrupted)});
        });
  });
}

void QVRecordingManager::notifySystemRecordingMayBeStopped() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    for (const Session& session : manager.runningSystemRecordings()) session->notifyRecordingMayBeStopped();
  });
}

void QVRecordingManager::notifySystemRecordingResumed() {
  sequence_.async(weak_from_this(), [](QVRecordingManager& manager) {
    for (const Session& session : manager.runningSystemRecordings()) session->notifyRecordingResumed();
  });
}

}  // namespace qv
