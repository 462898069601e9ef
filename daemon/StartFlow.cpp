#include "daemon/StartFlow.h"

#include <utility>

#include "platform/threads/Log.h"
#include "session/VideoSize.h"
#include "support/QVDeviceLayout.h"
#include "support/QVDiskSpace.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
namespace logs = platform::logs;

namespace {
/// The program that internal security policies are asked for.
constexpr const char kDaemonDomain[] = "com.tarnwick.quorveld";
constexpr int32_t kNoProcess = -1;
}  // namespace

StartFlow::StartFlow(StartServices& services, Session session, request::StartRecording request,
                     platform::IPCReply reply, std::function<void()> over)
    : services_(services),
      session_(std::move(session)),
      request_(std::move(request)),
      over_(std::move(over)),
      answer_(std::in_place, services.context.errors, std::move(reply)) {}

/// A former recording of this application ends before anything of the new one begins.
void StartFlow::run() {
  QV_LOG(logs::kDaemon,
         "QVRecordingManager:startRecordingWindowLayerContextID:windowSize:microphoneEnabled:streaming:withHandler:");
  services_.stopCurrentRecordings();
  services_.sessions.whenEnded(session_->bundleID(), [weakSelf = weak_from_this()] {
    if (const auto self = weakSelf.lock()) self->continueAfterStops();
  });
}

bool StartFlow::isInFront() const {
  return request_.systemRecording ||
         services_.foreground.isApplicationInForegroundWithBundleIdentifier(session_->bundleID());
}

void StartFlow::continueAfterStops() {
  const auto unwritable = services_.context.files.prepareForMovies();
  if (unwritable && !isLackOfSpace(unwritable)) {
    QV_LOG_ERROR(logs::kDaemon, "movies cannot be written, calling handler with error: %s",
                 unwritable->description().c_str());
    refuse(recordingError(errorcode::kFailedToStart));
    return;
  }
  if (unwritable || !services_.context.space._srDeviceHasSufficientFreeSpaceForRecording()) {
    QV_LOG_ERROR(logs::kDaemon, "insufficient disk space for recording, calling handler with error");
    refuse(recordingError(errorcode::kInsufficientStorage));
    return;
  }
  if (!isInFront()) {
    QV_LOG(logs::kDaemon, "app is not in the foreground, calling handler with error");
    refuse(recordingError(errorcode::kFailedToStart));
    return;
  }
  // What the user is asked, and what is answered, is what will be recorded.
  inputs_.microphone = request_.microphoneEnabled && services_.context.captureManager.hasAudioCaptureDevice();
  inputs_.camera = request_.cameraEnabled && services_.context.captureManager.hasVideoCaptureDevice();
  if (!request_.captureEnabled) services_.context.platform.assetWriter->prepareForWriting();
  if (request_.systemRecording || request_.broadcast) {
    begin();
  } else {
    showAcknowledgementAlertForSession();
  }
}

bool StartFlow::isAlertSuppressed() const {
  if (!services_.context.platform.deviceInfo->allowsInternalSecurityPolicies(kDaemonDomain)) return false;
  const bool suppressed =
      !services_.context.platform.preferences->valueForKey(kPreferenceDomain, "QVSuppressAlert").isNone();
  QV_LOG(logs::kDaemon, "QVRecordingManager: suppressAlert=%d", suppressed ? 1 : 0);
  return suppressed;
}

void StartFlow::showAcknowledgementAlertForSession() {
  if (isAlertSuppressed()) {
    begin();
    return;
  }
  QV_LOG(logs::kDaemon, "QVRecordingManager:showAcknowledgementAlert");
  if (services_.exemptions.isExemptFromAcknowledgementAlertSession(session_->owner(), inputs_.microphone)) {
    begin();
    return;
  }
  const AcknowledgementRequest request{session_->bundleID(), request_.captureEnabled, inputs_.microphone,
                                       inputs_.camera};
  alert_ = services_.acknowledgements.present(
      request, [weakSelf = weak_from_this(), &sequence = services_.sequence](const AcknowledgementAnswer& answer) {
        sequence.async(weakSelf, [answer](StartFlow& self) { self.continueAfterAcknowledgement(answer); });
      });
}

void StartFlow::continueAfterAcknowledgement(const AcknowledgementAnswer& answer) {
  if (!answer_) return;
  if (!answer.allowed) {
    QV_LOG(logs::kDaemon, "user declined");
    refuse(recordingError(errorcode::kUserDeclined));
    return;
  }
  inputs_ = {answer.microphone, answer.camera};
  services_.exemptions.updateExemptionListWithSession(session_->owner(), answer.microphone);
  begin();
}

RecordingSettings StartFlow::settings(const QVBroadcastInfo* broadcast) const {
  const platform::Platform& platform = services_.context.platform;
  RecordingSettings settings;
  settings.bundleID = session_->bundleID();
  settings.owner = session_->owner();
  settings.systemRecording = request_.systemRecording;
  settings.captureEnabled = request_.captureEnabled;
  settings.microphoneEnabled = request_.systemRecording ? request_.microphoneEnabled : inputs_.microphone;
  settings.contextIDs = request_.contextIDs;
  settings.windowSize = _maximumSizeWithSize(request_.windowSize, *platform.preferences, *platform.deviceInfo);
  if (broadcast) settings.broadcast = BroadcastPlan{*broadcast, request_.listenerEndpoint};
  return settings;
}

/// From here on a recording is made, and owns the answer.
void StartFlow::begin() {
  const QVBroadcastInfo* broadcast = nullptr;
  if (request_.broadcast) {
    QV_LOG(logs::kDaemon, "broadcast requested");
    broadcast = services_.broadcasts.infoForHostBundleID(session_->owner());
    if (!broadcast) {
      QV_LOG(logs::kDaemon, "attempted to start broadcast without a session, bailing out");
      refuse(recordingError(errorcode::kInvalidBroadcastSession));
      return;
    }
    QV_LOG(logs::kDaemon, "found broadcast info, enabling for session");
  } else {
    QV_LOG(logs::kDaemon, "broadcast disabled");
  }
  recording_ = session_->beginRecording(settings(broadcast), std::move(*answer_));
  answer_.reset();
  services_.sessions.noteRecording(recording_);
  services_.interruptOthers(session_);
  recording_->prepare([weakSelf = weak_from_this()] {
    if (const auto self = weakSelf.lock()) self->continueAfterPreparing();
  });
}

/// An extension takes its time: the application may have left the front meanwhile.
void StartFlow::continueAfterPreparing() {
  if (request_.broadcast && !isInFront()) {
    QV_LOG(logs::kDaemon, "app is not in the foreground, calling handler with error");
    recording_->end({.cause = recordingError(errorcode::kFailedToStart)});
    return;
  }
  frontmostSession([weakSelf = weak_from_this()](int32_t processID) {
    const auto self = weakSelf.lock();
    if (!self) return;
    self->recording_->startSessionWithHandler(processID, [weakSelf] {
      if (const auto started = weakSelf.lock()) started->recordingStarted();
    });
  });
}

void StartFlow::frontmostSession(std::function<void(int32_t)> handler) {
  if (request_.systemRecording) {
    services_.foreground.frontmostProcess(std::move(handler));
    return;
  }
  const auto proxy = session_->clientProxy();
  const auto connection = proxy ? proxy->connection() : nullptr;
  handler(connection ? connection->processIdentifier() : kNoProcess);
}

void StartFlow::recordingStarted() {
  const auto self = shared_from_this();
  services_.willAnswer(session_);
  QV_LOG(logs::kDaemon, "recording session started");
  over_();
  recording_->answerStarted(inputs_);
  services_.didAnswer(session_);
}

void StartFlow::refuse(const Error& error) {
  const auto self = shared_from_this();
  if (answer_) std::exchange(answer_, std::nullopt)->refused(error);
  over_();
}

void StartFlow::cancel() {
  if (!recording_) {
    refuse(recordingError(errorcode::kUserDeclined));
  } else if (!request_.systemRecording) {
    // Over at once: an application that comes back may start again, and waits for the end of this.
    const auto self = shared_from_this();
    recording_->finishAndCleanupSessionFiles(std::nullopt);
    over_();
  }
}

}  // namespace qv
