#include "daemon/QVRecordingManager.h"
#include "daemon/RequestErrors.h"
#include "platform/Log.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::IPCArguments;
using platform::IPCReply;
using platform::Value;
namespace logs = platform::logs;

const std::map<std::string_view, QVRecordingManager::RequestMember>& QVRecordingManager::requestMembers() {
  using Manager = QVRecordingManager;
  static const std::map<std::string_view, RequestMember> members{
      {"startRecordingWindowLayerContextIDs", &Manager::startRecordingWindowLayerContextIDs},
      {"setupBroadcastWithHostBundleID", &Manager::setupBroadcastWithHostBundleID},
      {"getCurrentBroadcastImages", &Manager::getCurrentBroadcastImages},
      {"getSystemBroadcastExtensionInfo", &Manager::getSystemBroadcastExtensionInfo},
      {"stopRecordingWithHandler", &Manager::stopRecordingWithHandler},
      {"stopRecordingWithStartClipDuration", &Manager::stopRecordingWithStartClipDuration},
      {"saveVideoToCameraRoll", &Manager::saveVideoToCameraRoll},
      {"pauseRecording", &Manager::pauseRecording},
      {"resumeRecordingWithWindowLayerContextID", &Manager::resumeRecordingWithWindowLayerContextID},
      {"setMicrophoneEnabled", &Manager::setMicrophoneEnabled},
      {"updateProcessIDForAudioCaptureWithPID", &Manager::updateProcessIDForAudioCaptureWithPID},
      {"discardRecordingWithHandler", &Manager::discardRecordingWithHandler},
      {"clientDidBecomeActive", &Manager::clientDidBecomeActive},
      {"clientDidResignActive", &Manager::clientDidResignActive},
      {"synchronousGetCurrentState", &Manager::synchronousGetCurrentState},
      {"setHasUserConsentForCamera", &Manager::setHasUserConsentForCamera},
      {"setHasUserConsentForMicrophone", &Manager::setHasUserConsentForMicrophone},
      {"setBroadcastURL", &Manager::setBroadcastURL},
      {"setMicrophoneEnabledPersistent", &Manager::setMicrophoneEnabledPersistent},
      {"reportCameraUsage", &Manager::reportCameraUsage},
  };
  return members;
}

void QVRecordingManager::handleCall(const std::shared_ptr<platform::IPCConnection>& connection,
                                    const platform::IPCOperation& operation, IPCArguments arguments, IPCReply reply) {
  sequence_.assertOnQueue();
  const auto member = requestMembers().find(operation.member);
  if (member == requestMembers().end()) {
    reply.fail(requesterror::kNotSupported, operation.member);
    return;
  }
  callingConnection_ = connection;
  (this->*member->second)(arguments, reply);
  callingConnection_ = nullptr;
}

void QVRecordingManager::pauseRecording(const IPCArguments&, const IPCReply&) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:pauseRecording");
  const Session session = getCallingConnectionRecordingSession();
  if (!session || session->isSystemRecording() || !session->isRecording() || session->isPaused()) return;
  session->pauseSession();
}

void QVRecordingManager::resumeRecordingWithWindowLayerContextID(const IPCArguments& arguments, const IPCReply&) {
  const Session session = getCallingConnectionRecordingSession();
  if (!session) return;
  const auto contextID = static_cast<uint32_t>(arguments[0].asInteger());
  // A broadcast would be resumed by an alert; that alert presents nothing, so it stays paused.
  if (session->isBroadcasting() && session->isRecording() && !session->isSystemRecording() && !didAcceptResume_) {
    (void)showResumeBroadcastAlert(session, contextID);
    return;
  }
  didAcceptResume_ = false;
  const bool matches = checkContextIDsMatch({contextID});
  if (matches) QV_LOG(logs::kDaemon, "QVRecordingManager: resumeRecording");
  if (session->isSystemRecording() || !session->isRecording() || !session->isPaused()) return;
  if (matches) {
    session->resumeSessionWithContextID(contextID);
    return;
  }
  const auto stopped = [this, session, generation = session->generation()](const auto& movie, const auto&) {
    const platform::Error mismatch = _qvUserErrorForCode(errorcode::kNoContextIDMatch);
    recordingSessionStoppedWithErrorMovieURL(session, {generation, mismatch, movie});
  };
  stopRecordingSession(session, 0, 0, stopped);
}

void QVRecordingManager::setMicrophoneEnabled(const IPCArguments& arguments, const IPCReply&) {
  const bool enabled = arguments[0].asBool();
  QV_LOG(logs::kDaemon, "QVRecordingManager: setMicrophoneEnabled:%i", enabled ? 1 : 0);
  const Session session = getCallingConnectionRecordingSession();
  if (session && session->isRecording()) session->setMicrophoneEnabled(enabled);
}

void QVRecordingManager::updateProcessIDForAudioCaptureWithPID(const IPCArguments& arguments, const IPCReply&) {
  const auto processID = static_cast<int32_t>(arguments[0].asInteger());
  QV_LOG(logs::kDaemon, "QVRecordingManager: updateProcessIDForAudioCaptureWithPID:%i", processID);
  const Session session = getCallingConnectionRecordingSession();
  if (session && session->isRecording()) session->updateProcessIDForAudioCaptureWithPID(processID);
}

void QVRecordingManager::synchronousGetCurrentState(const IPCArguments&, const IPCReply& reply) {
  const Session session = getCallingConnectionRecordingSession();
  if (!session) {
    reply({Value(Dictionary{})});
    return;
  }
  Dictionary state{
      {"isRecording", Value(session->isRecording())},
      {"isBroadcasting", Value(session->isBroadcasting())},
      {"microphoneEnabled", Value(session->microphoneEnabled())},
      {"isSystemRecording", Value(session->isSystemRecording())},
      {"hasUserConsentForMicrophone", Value(session->hasUserConsentForMicrophone())},
      {"hasUserConsentForCamera", Value(session->hasUserConsentForCamera())},
      {"microphoneEnabledPersistent", Value(session->microphoneEnabledPersistent())},
  };
  if (session->broadcastURL()) state.emplace("broadcastURL", Value(*session->broadcastURL()));
  reply({Value(std::move(state))});
}

void QVRecordingManager::setHasUserConsentForCamera(const IPCArguments& arguments, const IPCReply&) {
  if (const Session session = getCallingConnectionRecordingSession()) {
    session->setHasUserConsentForCamera(arguments[0].asBool());
  }
}

void QVRecordingManager::setHasUserConsentForMicrophone(const IPCArguments& arguments, const IPCReply&) {
  if (const Session session = getCallingConnectionRecordingSession()) {
    session->setHasUserConsentForMicrophone(arguments[0].asBool());
  }
}

void QVRecordingManager::setBroadcastURL(const IPCArguments& arguments, const IPCReply&) {
  const Session session = getCallingConnectionRecordingSession();
  if (!session) return;
  const std::string url = arguments[0].asString();
  session->setBroadcastURL(url.empty() ? std::nullopt : std::optional(url));
}

void QVRecordingManager::setMicrophoneEnabledPersistent(const IPCArguments& arguments, const IPCReply&) {
  if (const Session session = getCallingConnectionRecordingSession()) {
    session->setMicrophoneEnabledPersistent(arguments[0].asBool());
  }
}

void QVRecordingManager::reportCameraUsage(const IPCArguments& arguments, const IPCReply&) {
  if (const Session session = getCallingConnectionRecordingSession()) {
    session->sessionReportCameraUsage(static_cast<int32_t>(arguments[0].asInteger()));
  }
}

}  // namespace qv
