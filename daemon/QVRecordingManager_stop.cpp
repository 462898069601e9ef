#include <filesystem>

#include "daemon/QVRecordingManager.h"
#include "daemon/RequestErrors.h"
#include "platform/Log.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"
#include "writer/QVAudioMixUtility.h"

namespace qv {

using platform::Error;
using platform::IPCArguments;
using platform::IPCReply;
using platform::URL;
using platform::Value;
namespace logs = platform::logs;

namespace {

std::string normalized(const URL& url) { return std::filesystem::path(url.path()).lexically_normal().string(); }

Value encodeURL(const std::optional<URL>& url) { return Value(url ? url->absoluteString() : std::string()); }

}  // namespace

void QVRecordingManager::stopCurrentRecordingSessionWithHandler() {
  QV_LOG(logs::kDaemon, "QVRecordingManager:stopCurrentRecordingSession:");
  // A copy: the stops change the registry's sessions, and may change the registry.
  const auto sessions = bundleIDToRecordingSessionLookup_;
  for (const auto& [bundleID, session] : sessions) {
    if (!session->isRecording()) continue;
    const auto hold = holdEnding(bundleID);
    const uint64_t generation = session->generation();
    stopRecordingSession(session, 0, 0, [this, session = session, generation, hold](const auto& movie, const auto&) {
      if (session->isSystemRecording()) {
        saveStoppedSystemRecording(session, generation, movie);
      } else {
        reportStoppedByOtherStart(session, generation);
      }
    });
  }
}

void QVRecordingManager::reportStoppedByOtherStart(const Session& session, uint64_t generation) {
  // The start that waits for this one's end goes on when the file is gone, and so is the hold.
  session->finishAndCleanupSessionFilesWithHandler(
      [weakSelf = weak_from_this(), session, generation, hold = holdEnding(session->bundleID())] {
        const auto self = weakSelf.lock();
        if (!self) return;
        self->sequence_.async([self, session, generation, hold] {
          self->tellRecordingEnded(session, {generation, _qvUserErrorForCode(errorcode::kInterrupted)});
        });
      });
}

void QVRecordingManager::saveStoppedSystemRecording(const Session& session, uint64_t generation,
                                                    const std::optional<URL>& movie) {
  clearSystemRecordingUI(session);
  const auto hold = holdEnding(session->bundleID());
  const auto done = [weakSelf = weak_from_this(), session, generation, hold](const std::optional<Error>& error) {
    if (error) {
      QV_LOG_ERROR(logs::kDaemon, "QVRecordingManager:stopCurrentRecordingSession: Video saved to camera roll failed");
    } else {
      QV_LOG(logs::kDaemon, "QVRecordingManager:stopCurrentRecordingSession: Video saved to camera roll successful");
    }
    const auto self = weakSelf.lock();
    if (!self) return;
    self->sequence_.async([self, session, generation, hold] { self->reportStoppedByOtherStart(session, generation); });
  };
  if (!movie) {
    done(_qvUserErrorForCode(errorcode::kFailedToSave));
    return;
  }
  platform_.photoLibrary->createAsset(*movie, platform::PhotoResourceType::Video, done);
}

void QVRecordingManager::stopRecordingWithHandler(const IPCArguments&, const IPCReply& reply) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: stopRecordingWithHandler:");
  requestStop(0, 0, reply);
}

void QVRecordingManager::stopRecordingWithStartClipDuration(const IPCArguments& arguments, const IPCReply& reply) {
  requestStop(arguments[0].asDouble(), arguments[1].asDouble(), reply);
}

void QVRecordingManager::requestStop(double startClipDuration, double endClipDuration, const IPCReply& reply) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:");
  const Session session = getCallingConnectionRecordingSession();
  if (!session || !session->isRecording()) {
    reply.fail(requesterror::kNotRecording, "nothing is being recorded for this application");
    return;
  }
  stopRecordingSession(session, startClipDuration, endClipDuration,
                       [this, reply, bundleID = session->bundleID()](const auto& movie, const auto& error) {
                         if (movie) handMovieTo(bundleID, *movie);
                         reply({encodeURL(movie), Value(platform::encodeError(error))});
                       });
}

void QVRecordingManager::stopRecordingSession(const Session& session, double startClipDuration, double endClipDuration,
                                              FinishHandler handler) {
  // A session remembers what its last recording was, so one that does not record is left alone whole:
  // no sound when its client goes, and nobody else's follower taken away.
  if (session->isRecording()) checkAndPlaySystemRecordSound(session, false);
  QV_LOG(logs::kDaemon, "QVRecordingManager: stopRecordingSession:handler:");
  broadcasts_->clearPresentation();
  if (!session->isRecording()) return;
  clearSystemRecordingUI(session);
  if (layoutMonitor_) layoutMonitor_->removeObserver(this);
  if (handler) {
    finishRecording(session, startClipDuration, endClipDuration, std::move(handler));
    return;
  }
  QV_LOG(logs::kDaemon, "recording stopped without handler!");
  session->finishAndCleanupSessionFilesWithHandler([weakSelf = weak_from_this(), session,
                                                    generation = session->generation(),
                                                    hold = holdEnding(session->bundleID())] {
    const auto self = weakSelf.lock();
    if (!self) return;
    self->sequence_.async([self, session, generation, hold] { self->resetStatesForSession(session, generation); });
  });
}

/// Finishes a recording; `handler` and then the reset run on the sequence.
void QVRecordingManager::finishRecording(const Session& session, double startClipDuration, double endClipDuration,
                                         FinishHandler handler) {
  session->finishSessionWithStartClipDuration(
      startClipDuration, endClipDuration,
      [weakSelf = weak_from_this(), session, generation = session->generation(), hold = holdEnding(session->bundleID()),
       handler = std::move(handler)](const auto& movie, const auto& error) {
        const auto self = weakSelf.lock();
        if (!self) return;
        self->sequence_.async([self, session, generation, hold, handler, movie, error] {
          handler(movie, error);
          self->resetStatesForSession(session, generation);
        });
      });
}

void QVRecordingManager::discardRecordingWithHandler(const IPCArguments&, const IPCReply& reply) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: discardRecording");
  const Session session = getCallingConnectionRecordingSession();
  if (session && session->isRecording()) {
    QV_LOG_ERROR(logs::kDaemon, "can't discard recording while recording is in progress");
    reply.fail(requesterror::kRecording, "a recording is in progress");
    return;
  }
  if (!session) {
    reply.fail(requesterror::kNotRecording, "this caller has no recording session");
    return;
  }
  session->finishAndCleanupSessionFilesWithHandler([reply, hold = holdEnding(session->bundleID())] { reply({}); });
}

void QVRecordingManager::handMovieTo(const std::string& bundleID, const URL& movie) {
  handedMovies_[bundleID].insert(normalized(movie));
}

bool QVRecordingManager::wasHandedTo(const std::string& bundleID, const URL& movie) const {
  const auto handed = handedMovies_.find(bundleID);
  if (handed == handedMovies_.end() || !handed->second.contains(normalized(movie))) return false;
  const auto attributes = platform_.fileSystem->attributesOfItem(movie.path());
  return attributes && !attributes.value().isDirectory;
}

void QVRecordingManager::saveVideoToCameraRoll(const IPCArguments& arguments, const IPCReply& reply) {
  const URL movie(arguments[0].asString());
  const auto bundleID = getCallingConnectionBundleID();
  if (!bundleID || !wasHandedTo(*bundleID, movie)) {
    QV_LOG_ERROR(logs::kDaemon, "a movie that was not handed to the caller is not saved");
    reply({Value(platform::encodeError(_qvUserErrorForCode(errorcode::kFailedToSave)))});
    return;
  }
  handedMovies_[*bundleID].erase(normalized(movie));
  saveMovie(movie, [reply](const auto& error) { reply({Value(platform::encodeError(error))}); });
}

/// Stores the mixed movie where mixing worked and the given one otherwise, then removes both.
void QVRecordingManager::saveMovie(const URL& movie, std::function<void(const std::optional<Error>&)> handler) {
  QVAudioMixUtility::mixAudioForMovie(movie, [photoLibrary = platform_.photoLibrary, movie,
                                              handler = std::move(handler)](const auto& mixed, const auto& mixError) {
    if (mixError) QV_LOG_ERROR(logs::kDaemon, "Error Mixing video Audio tracks");
    QV_LOG(logs::kDaemon, "QVRecordingManager: saveVideoToCameraRoll:");
    photoLibrary->createAsset(
        mixed.value_or(movie), platform::PhotoResourceType::Video,
        [movie, mixed, handler](const std::optional<Error>& saveError) {
          if (saveError) {
            QV_LOG_ERROR(logs::kDaemon, "QVRecordingManager:saveVideoToCameraRoll: Video saved to camera roll failed");
          } else {
            QV_LOG(logs::kDaemon, "QVRecordingManager:saveVideoToCameraRoll: Video saved to camera roll successful");
          }
          _srRemoveFile(movie, nullptr);
          if (!mixed) {
            handler(saveError);
            return;
          }
          _srRemoveFile(*mixed, [handler, saveError](const std::optional<Error>& removalError) {
            if (removalError) {
              QV_LOG_ERROR(logs::kDaemon, "error removing file with code: %i", static_cast<int>(removalError->code));
            }
            handler(removalError ? removalError : saveError);
          });
        });
  });
}

}  // namespace qv
