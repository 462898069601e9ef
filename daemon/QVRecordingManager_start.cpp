#include <cmath>

#include "daemon/QVRecordingManager.h"
#include "daemon/StartRequest.h"
#include "platform/Log.h"
#include "support/QVExtensions.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::IPCArguments;
using platform::IPCReply;
using platform::Size;
using platform::Value;
namespace logs = platform::logs;

namespace {

constexpr double kLargestSide = 1e6;  // pixels; beyond it a size is nonsense, not a wish
constexpr int32_t kNoProcess = -1;

bool isSaneSide(double side) { return std::isfinite(side) && side >= 1 && side <= kLargestSide; }

void answerStart(const StartRequest& start, const std::optional<Error>& error, bool microphone, bool camera) {
  start.reply({Value(platform::encodeError(error)), Value(microphone), Value(camera)});
}

platform::ListenerEndpoint endpointFrom(const Value& handles) {
  for (const Value& handle : handles.asArray()) {
    if (const auto* descriptor = handle.getIf<platform::SharedFileDescriptor>()) {
      return platform::ListenerEndpoint(*descriptor);
    }
  }
  return {};
}

}  // namespace

void QVRecordingManager::startRecordingWindowLayerContextIDs(const IPCArguments& arguments, const IPCReply& reply) {
  auto start = std::make_shared<StartRequest>();
  start->session = getCallingConnectionRecordingSession();
  start->connection = callingConnection_;
  start->reply = reply;
  for (const Value& contextID : arguments[0].asArray()) {
    start->contextIDs.push_back(static_cast<uint32_t>(contextID.asInteger()));
  }
  const auto& size = arguments[1].asArray();
  if (size.size() == 2) start->windowSize = Size{size[0].asDouble(), size[1].asDouble()};
  start->microphoneEnabled = arguments[2].asBool();
  start->cameraEnabled = arguments[3].asBool();
  start->broadcast = arguments[4].asBool();
  start->systemRecording = arguments[5].asBool();
  start->captureEnabled = arguments[6].asBool();
  start->listenerEndpoint = endpointFrom(arguments[7]);
  if (const auto error = checkStartIsAllowed(*start)) {
    answerStart(*start, error, false, false);
    return;
  }
  QV_LOG(logs::kDaemon,
         "QVRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:");
  pendingStarts_[start->session->bundleID()] = start;
  stopCurrentRecordingSessionWithHandler();
  // A former recording of this application ends before anything of the new one begins.
  whenEnded(start->session->bundleID(), [this, start] { continueStartAfterStops(start); });
}

/// The checks that leave everything as it is.
std::optional<Error> QVRecordingManager::checkStartIsAllowed(const StartRequest& start) {
  if (!start.session) {
    QV_LOG_ERROR(logs::kDaemon,
                 "a recording was requested by process %d, which belongs to no application bundle: put the "
                 "executable below a directory with an Info.json that has a CFBundleIdentifier, in an installed "
                 "bundle root or one named by QUORVEL_BUNDLE_PATH",
                 static_cast<int>(callingConnection_->processIdentifier()));
    return _qvUserErrorForCode(errorcode::kFailedToStart);
  }
  if (start.systemRecording && !callingConnection_->valueForEntitlement(kPrivateEntitlement).asBool()) {
    return _qvUserErrorForCode(errorcode::kEntitlements);
  }
  if (!start.systemRecording && !checkContextIDsMatch(start.contextIDs)) {
    return _qvUserErrorForCode(errorcode::kFailedToStart);
  }
  if (!isSaneSide(start.windowSize.width) || !isSaneSide(start.windowSize.height)) {
    QV_LOG_ERROR(logs::kDaemon, "window size %f x %f cannot be recorded", start.windowSize.width,
                 start.windowSize.height);
    return _qvUserErrorForCode(errorcode::kFailedToStart);
  }
  if (pendingStarts_.contains(start.session->bundleID())) {
    QV_LOG(logs::kDaemon, "another start of this application is still on its way");
    return _qvUserErrorForCode(errorcode::kFailedToStart);
  }
  return std::nullopt;
}

bool QVRecordingManager::checkContextIDsMatch(const std::vector<uint32_t>& contextIDs) {
  const auto caller = getCallingConnectionBundleID();
  for (const uint32_t contextID : contextIDs) {
    const auto owner = platform_.renderServer->ownerOfContext(contextID);
    if (!owner) return false;
    const auto bundle = bundleWithPID(*owner);
    if (!bundle || !caller || bundle->bundleIdentifier() != *caller) return false;
  }
  return true;
}

bool QVRecordingManager::isApplicationInForegroundWithBundleIdentifier(const std::string& bundleID) {
  return (applicationStateMonitor_->applicationStateForBundleIdentifier(bundleID) & platform::kApplicationForeground) !=
         0;
}

void QVRecordingManager::continueStartAfterStops(const Start& start) {
  if (start->isOver) return;
  if (start->session->isRecording()) {
    answerStart(*start, std::nullopt, start->microphoneRecording, start->cameraRecording);
    endStart(start);
    return;
  }
  if (!_srDeviceHasSufficientFreeSpaceForRecording()) {
    QV_LOG_ERROR(logs::kDaemon, "insufficient disk space for recording, calling handler with error");
    refuseStart(start, _qvUserErrorForCode(errorcode::kInsufficientStorage));
    return;
  }
  if (!start->systemRecording && !isApplicationInForegroundWithBundleIdentifier(start->session->bundleID())) {
    QV_LOG(logs::kDaemon, "app is not in the foreground, calling handler with error");
    refuseStart(start, _qvUserErrorForCode(errorcode::kFailedToStart));
    return;
  }
  platform_.assetWriter->prepareForWriting();
  start->microphoneRecording = start->microphoneEnabled;
  start->cameraRecording = start->cameraEnabled;
  if (start->systemRecording || start->broadcast) {
    beginRecording(start);
  } else {
    showAcknowledgementAlertForSession(start);
  }
}

void QVRecordingManager::beginRecording(const Start& start) {
  QV_LOG(logs::kDaemon, "starting...");
  beginTransaction();
  if (start->broadcast) {
    enableBroadcast(start);
    return;
  }
  QV_LOG(logs::kDaemon, "broadcast disabled");
  start->session->disableBroadcast();
  recordWhatIsFrontmost(start);
}

void QVRecordingManager::recordWhatIsFrontmost(const Start& start) {
  configureSession(start);
  frontmostSession(start->session, [weakSelf = weak_from_this(), start](int32_t processID) {
    if (const auto self = weakSelf.lock()) self->startSession(start, processID);
  });
}

void QVRecordingManager::configureSession(const Start& start) {
  QVRecordingSession& session = *start->session;
  session.setRecording(true);
  start->generation = session.generation();
  openTransactions_.emplace(&session, start->generation);
  session.setIsBroadcasting(start->broadcast);
  interruptOtherRecordingSessionAgainstSession(start->session);
  session.setSystemRecording(start->systemRecording);
  session.setContextIDs(start->contextIDs);
  session.setWindowSize(start->windowSize);
  session.setMicrophoneEnabled(start->systemRecording ? start->microphoneEnabled : start->microphoneRecording);
  session.setDelegate(weak_from_this());
  session.setCaptureRecording(start->captureEnabled);
}

void QVRecordingManager::frontmostSession(const Session& session, std::function<void(int32_t)> handler) {
  if (!session->isSystemRecording()) {
    const auto proxy = session->clientProxy();
    const auto connection = proxy ? proxy->connection() : nullptr;
    handler(connection ? connection->processIdentifier() : kNoProcess);
    return;
  }
  const auto frontmost = platform_.applications->frontmostApplication();
  if (!frontmost) {
    handler(kNoProcess);
    return;
  }
  applicationStateMonitor_->applicationInfoForBundleIdentifier(
      *frontmost, [weakSelf = weak_from_this(), handler = std::move(handler)](const Dictionary& information) {
        const auto processID = static_cast<int32_t>(
            platform::valueForKey(information, platform::applicationstate::kProcessIDKey).asInteger(kNoProcess));
        if (const auto self = weakSelf.lock()) self->sequence_.async([handler, processID] { handler(processID); });
      });
}

void QVRecordingManager::startSession(const Start& start, int32_t processID) {
  if (start->isOver) return;
  start->session->setFrontmostPIDForAudioTap(processID);
  start->session->startSessionWithHandler([weakSelf = weak_from_this(), start] {
    if (const auto self = weakSelf.lock()) self->recordingStarted(start);
  });
}

void QVRecordingManager::recordingStarted(const Start& start) {
  if (start->isOver) return;
  const Session& session = start->session;
  if (!session->isRecording() || session->generation() != start->generation) {
    // It was ended while its file was being prepared; its end closes the transaction.
    (void)session->takeEndReport(start->generation);
    refuseStart(start, _qvUserErrorForCode(errorcode::kInterrupted));
    return;
  }
  checkAndPlaySystemRecordSound(session, true);
  QV_LOG(logs::kDaemon, "recording session started");
  answerStart(*start, std::nullopt, start->microphoneRecording, start->cameraRecording);
  endStart(start);
  if (session->isSystemRecording()) {
    installForegroundFollower(session);
  } else {
    followedSession_.reset();
    applicationStateMonitor_->setHandler(nullptr);
    observeDisplayLayout();
  }
}

void QVRecordingManager::refuseStart(const Start& start, const Error& error) {
  answerStart(*start, error, false, false);
  endStart(start);
}

void QVRecordingManager::endStart(const Start& start) {
  start->isOver = true;
  start->alert.reset();
  const auto pending = pendingStarts_.find(start->session->bundleID());
  if (pending != pendingStarts_.end() && pending->second == start) pendingStarts_.erase(pending);
}

/// The client has gone: its alert goes away, and nobody gets an answer. What it had recorded of an
/// application goes too, but a system recording needs no client, also while it begins.
void QVRecordingManager::cancelPendingStart(const std::string& bundleID) {
  const auto pending = pendingStarts_.find(bundleID);
  if (pending == pendingStarts_.end()) return;
  const Start start = pending->second;
  const bool hasBegun = start->generation != 0;
  if (hasBegun && start->systemRecording) return;
  refuseStart(start, _qvUserErrorForCode(errorcode::kUserDeclined));
  if (hasBegun && start->session->generation() == start->generation) {
    stopRecordingSession(start->session, 0, 0, nullptr);
  }
}

QVRecordingManager::Start QVRecordingManager::unansweredStart(const Session& session, uint64_t generation) const {
  const auto pending = pendingStarts_.find(session->bundleID());
  if (pending == pendingStarts_.end()) return nullptr;
  const Start& start = pending->second;
  return start->session == session && start->generation == generation ? start : nullptr;
}

}  // namespace qv
