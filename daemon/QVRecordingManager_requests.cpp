#include <utility>

#include "daemon/QVRecordingManager.h"
#include "platform/threads/Log.h"
#include "support/QVBundleTexts.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
using platform::IPCReply;
using platform::URL;
using platform::Value;
namespace logs = platform::logs;

namespace {

Value encodeURL(const std::optional<URL>& url) { return Value(url ? url->absoluteString() : std::string()); }

}  // namespace

void QVRecordingManager::handleCall(const std::shared_ptr<platform::IPCConnection>& connection,
                                    const platform::IPCOperation& operation, platform::IPCArguments arguments,
                                    IPCReply reply) {
  sequence_.assertOnQueue();
  const Caller caller{connection};
  const platform::LogQuotas::Scope lines(logQuotas_, caller.user());
  requests_.serve(caller, operation, arguments, reply);
}

void QVRecordingManager::addRecordingRequests() {
  requests_.addIdentified<request::StartRecording>(
      [this](const Caller& caller, const auto& request, const IPCReply& reply) {
        starts_.startRecordingWindowLayerContextIDs(caller, request, reply);
      },
      [this](const auto& request, const IPCReply& reply) {
        const auto code = request.systemRecording ? errorcode::kEntitlements : errorcode::kFailedToStart;
        StartAnswer(context_->errors, reply).refused(recordingError(code));
      });
  requests_.add<request::Stop>([this](const Caller& caller, const auto&, const IPCReply& reply) {
    QV_LOG(logs::kDaemon, "QVRecordingManager: stopRecordingWithHandler:");
    requestStop(caller, 0, 0, reply);
  });
  requests_.add<request::StopTrimmed>([this](const Caller& caller, const auto& request, const IPCReply& reply) {
    requestStop(caller, request.startClipDuration, request.endClipDuration, reply);
  });
  requests_.add<request::SaveVideo>([this](const Caller& caller, const auto& request, const IPCReply& reply) {
    handover_->saveVideoToCameraRoll(caller.owner(), request.movieURL,
                                     [reply, context = context_](const std::optional<Error>& error) {
                                       reply({Value(context->errors.encoded(error))});
                                     });
  });
  requests_.addIdentified<request::OpenMovie>(
      [this](const Caller& caller, const auto& request, const IPCReply& reply) {
        const auto movie = handover_->openMovie(caller.owner(), request.movieURL);
        reply({movie ? platform::Array{Value(movie.value())} : platform::Array{},
               Value(context_->errors.encoded(movie ? std::nullopt : std::optional(movie.error())))});
      },
      [this](const auto&, const IPCReply& reply) {
        reply({platform::Array{}, Value(context_->errors.encoded(recordingError(errorcode::kFailedToSave)))});
      });
  requests_.add<request::Discard>(
      [this](const Caller& caller, const auto&, const IPCReply& reply) { discardRecording(caller, reply); });
  requests_.add<request::Pause>([this](const Caller& caller, const auto&, const IPCReply&) {
    QV_LOG(logs::kDaemon, "QVRecordingManager:pauseRecording");
    const Session session = sessions_->find(caller.bundleID());
    if (session && session->isRecording())
      session->recording()->whenAnswered([weakSelf = weak_from_this(), session] {
        if (const auto self = weakSelf.lock()) self->pauseRecording(session);
      });
  });
  requests_.add<request::Resume>([this](const Caller& caller, const auto& request, const IPCReply&) {
    const Session session = sessions_->find(caller.bundleID());
    if (!session || !session->isRecording()) return;
    session->recording()->whenAnswered(
        [this, caller, session, contextID = request.contextID] { resumeRecording(caller, session, contextID); });
  });
  requests_.add<request::SetMicrophoneEnabled>([this](const Caller& caller, const auto& request, const IPCReply&) {
    QV_LOG(logs::kDaemon, "QVRecordingManager: setMicrophoneEnabled:%i", request.enabled ? 1 : 0);
    const Session session = sessions_->find(caller.bundleID());
    if (session && session->isRecording()) session->setMicrophoneEnabled(request.enabled);
  });
  requests_.addIdentified<request::UpdateProcessID>(
      [this](const Caller& caller, const auto& request, const IPCReply&) {
        updateProcessID(caller, request.processID);
      },
      [](const auto&, const IPCReply&) {});
  requests_.add<request::ReportCameraUsage>([this](const Caller& caller, const auto& request, const IPCReply&) {
    const Session session = sessions_->find(caller.bundleID());
    if (session && session->isRecording()) session->recording()->sessionReportCameraUsage(request.cameraPosition);
  });
}

/// A stop that was sent together with its start comes after it: the start is answered first.
void QVRecordingManager::requestStop(const Caller& caller, double startClipDuration, double endClipDuration,
                                     const IPCReply& reply) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: stopRecordingWithStartTimeOffset:endTimeOffset:handler:");
  const Session session = sessions_->find(caller.bundleID());
  if (!session || !session->isRecording()) {
    reply.fail(requesterror::kNotRecording, "nothing is being recorded for this application");
    return;
  }
  session->recording()->whenAnswered(
      [weakSelf = weak_from_this(), caller, session, startClipDuration, endClipDuration, reply] {
        if (const auto self = weakSelf.lock())
          self->stopForClient(caller, session, startClipDuration, endClipDuration, reply);
      });
}

void QVRecordingManager::stopForClient(const Caller& caller, const Session& session, double startClipDuration,
                                       double endClipDuration, const IPCReply& reply) {
  if (!session->isRecording()) {
    reply.fail(requesterror::kNotRecording, "the recording has ended already");
    return;
  }
  const auto proxy = session->clientProxy();
  if (proxy && proxy->connection() != caller.connection) {
    // Whoever asked has gone meanwhile. The client that came after it is told, and has the movie.
    stopRecordingSession(session, [](QVRecording& recording) {
      recording.end(
          {.cause = recordingError(errorcode::kInterrupted), .movie = moviefate::handTo(recording.settings().owner)});
    });
    return;
  }
  const auto answer = [reply, context = context_](const std::optional<URL>& movie, const std::optional<Error>& error) {
    reply({encodeURL(movie), Value(context->errors.encoded(error))});
  };
  stopRecordingSession(session, [&](QVRecording& recording) {
    recording.finishSessionWithStartClipDuration(startClipDuration, endClipDuration, answer);
  });
}

/// What the caller was handed last. While its recording is ending, that is not known yet.
void QVRecordingManager::discardRecording(const Caller& caller, const IPCReply& reply) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: discardRecording");
  const Session session = sessions_->find(caller.bundleID());
  if (!session) {
    reply.fail(requesterror::kNotRecording, "this caller has no recording session");
  } else if (session->isRecording()) {
    QV_LOG_ERROR(logs::kDaemon, "can't discard recording while recording is in progress");
    reply.fail(requesterror::kRecording, "a recording is in progress");
  } else {
    const auto discard = [handover = handover_, owner = session->owner(), reply] {
      handover->discard(owner, [reply] { reply({}); });
    };
    if (session->recording()) {
      session->recording()->whenEnded(discard);
    } else {
      discard();
    }
  }
}

void QVRecordingManager::pauseRecording(const Session& session) {
  if (session->isSystemRecording() || !session->isRecording()) return;
  session->recording()->pauseSession();
}

void QVRecordingManager::resumeRecording(const Caller& caller, const Session& session, uint32_t contextID) {
  if (!session->isRecording()) return;
  // A broadcast would be resumed by an alert; that alert presents nothing, so it stays paused.
  if (session->isBroadcasting() && !session->isSystemRecording()) {
    (void)SessionAlerts::showResumeBroadcastAlert(session, contextID);
    return;
  }
  const bool matches = starts_.checkContextIDsMatch(caller, {contextID});
  if (matches) QV_LOG(logs::kDaemon, "QVRecordingManager: resumeRecording");
  if (session->isSystemRecording() || !session->isPaused()) return;
  if (matches) {
    session->recording()->resumeSessionWithContextID(contextID);
  } else {
    stopRecordingSession(session, [](QVRecording& recording) {
      recording.end({.cause = recordingError(errorcode::kNoContextIDMatch),
                     .movie = moviefate::handTo(recording.settings().owner)});
    });
  }
}

/// An application has its own processes recorded; those of others only the system.
void QVRecordingManager::updateProcessID(const Caller& caller, int32_t processID) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: updateProcessIDForAudioCaptureWithPID:%i", processID);
  const Session session = sessions_->find(caller.bundleID());
  if (!session || !session->isRecording()) return;
  if (processID >= 1 && !caller.isPrivileged() && !starts_.isOfCallersApplication(caller, processID)) {
    QV_LOG_ERROR(logs::kDaemon, "the sound of process %i is not the caller's to record", processID);
    return;
  }
  session->recording()->updateProcessIDForAudioCaptureWithPID(processID);
}

}  // namespace qv
