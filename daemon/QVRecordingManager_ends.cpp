#include <utility>

#include "daemon/QVRecordingManager.h"
#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
using platform::URL;
namespace logs = platform::logs;

/// The stop that somebody asked for: a client, its leaving, or another start.
void QVRecordingManager::stopRecordingSession(const Session& session, const std::function<void(QVRecording&)>& end) {
  // A session remembers what its last recording was, so one that does not record makes no sound when its client goes.
  if (session->isRecording()) checkAndPlaySystemRecordSound(session, false);
  QV_LOG(logs::kDaemon, "QVRecordingManager: stopRecordingSession:handler:");
  broadcasts_->clearPresentation();
  if (!session->isRecording()) return;
  end(*session->recording());
}

/// The movie of an application goes; that of a system recording goes to the photo library, or stays its client's where
/// the library refuses it.
void QVRecordingManager::stopCurrentRecordingSessionWithHandler() {
  QV_LOG(logs::kDaemon, "QVRecordingManager:stopCurrentRecordingSession:");
  for (const Session& session : sessions_->recordingSessions()) {
    stopRecordingSession(session, [this](QVRecording& recording) {
      const Error interrupted = recordingError(errorcode::kInterrupted);
      if (recording.settings().systemRecording) {
        recording.end({.cause = interrupted, .movie = storeInPhotoLibrary(recording.settings().owner)});
      } else {
        recording.finishAndCleanupSessionFiles(interrupted);
      }
    });
  }
}

MovieFate QVRecordingManager::storeInPhotoLibrary(const std::string& owner) const {
  return [handover = handover_, owner](const OutputResult& made, auto done) {
    // What is left of a failed write stays with whoever can be told of it.
    if (made.failure) return moviefate::handTo(owner)(made, done);
    handover->storeSystemRecording(made.movie, owner,
                                   [done](const std::optional<URL>& kept, const auto&) { done(kept); });
  };
}

MovieFate QVRecordingManager::saveInPhotoLibrary(const std::string& owner) const {
  return [handover = handover_, owner](const OutputResult& made, auto done) {
    if (made.failure) return moviefate::handTo(owner)(made, done);
    handover->saveInterrupted(made.movie, owner, [done](const auto& kept, const auto&) { done(kept); });
  };
}

/// Nothing is lost: an application is handed its movie, and that of a system recording goes to the photo library.
void QVRecordingManager::stopForUser(const std::shared_ptr<QVRecording>& recording) {
  const RecordingSettings& settings = recording->settings();
  const Session session = sessions_->find(settings.bundleID);
  if (!session || session->recording() != recording) return;
  stopRecordingSession(session, [this, &settings](QVRecording& stopped) {
    stopped.end(
        {.cause = recordingError(errorcode::kInterrupted),
         .movie = settings.systemRecording ? saveInPhotoLibrary(settings.owner) : moviefate::handTo(settings.owner)});
  });
}

void QVRecordingManager::interruptOtherRecordingSessionAgainstSession(const Session& session) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:interruptRecordingSessions");
  for (const Session& other : sessions_->recordingSessions()) {
    if (other == session) continue;
    QV_LOG(logs::kDaemon, "interrupted session");
    other->recording()->end(
        {.cause = recordingError(errorcode::kInterrupted), .movie = moviefate::handTo(other->owner())});
  }
}

void QVRecordingManager::endRecordingsOfApplications(const Error& cause) {
  for (const Session& session : sessions_->recordingSessions()) {
    if (session->isSystemRecording()) continue;
    session->recording()->end({.cause = cause, .movie = moviefate::handTo(session->owner())});
  }
}

void QVRecordingManager::recordingStarted(const Session& session) {
  if (!session->isRecording()) return;
  notices_->recordingStarted(session->recording());
  if (session->isSystemRecording()) {
    foreground_->follow(session->recording());
  } else {
    layoutRule_->observe();
  }
}

void QVRecordingManager::recordingSessionWillStop(const Session&, const std::shared_ptr<QVRecording>& recording) {
  notices_->recordingWillStop(*recording);
  if (recording->settings().systemRecording) foreground_->clearSystemRecordingUI(*recording);
  layoutRule_->ignore();
}

void QVRecordingManager::recordingSessionStoppedWithError(const Session& session, const std::optional<Error>& error,
                                                          const std::optional<URL>& movie) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:recordingSessionStoppedWithError:movieURL:");
  alerts_.alertUserOfEnd(session, error);
  // Told again when the application is in front and records anew: then it can be expected to listen.
  if (movie && error && error->code == errorcode::kInterrupted) session->setInterruptedMovieURL(movie);
  if (const auto proxy = session->clientProxy()) proxy->stopRecordingWithError(error, movie);
}

void QVRecordingManager::recordingSessionDidStop(const Session&, const std::shared_ptr<QVRecording>& recording) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:resetStatesForSession:");
  starts_.recordingEnded(*recording);
  if (recording->wasStarted()) broadcasts_->recordingEnded(recording);
}

void QVRecordingManager::broadcastSessionDidUpdateServiceInfo(const Session& session,
                                                              const platform::Dictionary& serviceInfo) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:broadcastSessionDidUpdateServiceInfo:");
  if (const auto proxy = session->clientProxy()) proxy->updateBroadcastServiceInfo(serviceInfo);
}

void QVRecordingManager::broadcastSessionDidUpdateDuration(QVRecordingSession&, double) {}

}  // namespace qv
