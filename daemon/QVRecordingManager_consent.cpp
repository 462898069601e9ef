#include "daemon/QVRecordingManager.h"
#include "daemon/StartRequest.h"
#include "platform/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {

namespace logs = platform::logs;

namespace {
constexpr const char kDaemonDomain[] = "com.tarnwick.quorveld";
}

/// Shows the alert unless the application is exempt. The start waits for the answer; the manager does
/// not.
void QVRecordingManager::showAcknowledgementAlertForSession(const Start& start) {
  if (platform_.deviceInfo->allowsInternalSecurityPolicies(kDaemonDomain)) {
    const bool suppressed = !platform_.preferences->valueForKey(kDaemonDomain, "QVSuppressAlert").isNone();
    QV_LOG(logs::kDaemon, "QVRecordingManager: suppressAlert=%d", suppressed ? 1 : 0);
    if (suppressed) {
      beginRecording(start);
      return;
    }
  }
  QV_LOG(logs::kDaemon, "QVRecordingManager:showAcknowledgementAlert");
  const std::string& bundleID = start->session->bundleID();
  if (exemptions_.isExemptFromAcknowledgementAlertSession(bundleID, start->microphoneRecording)) {
    beginRecording(start);
    return;
  }
  const AcknowledgementRequest request{bundleID, start->captureEnabled, start->microphoneRecording,
                                       start->cameraRecording};
  start->alert = presentAcknowledgementAlert(request, [weakSelf = weak_from_this(), start](auto answer) {
    const auto self = weakSelf.lock();
    if (!self) return;
    self->sequence_.async([self, start, answer] { self->continueStartAfterAcknowledgement(start, answer); });
  });
}

void QVRecordingManager::continueStartAfterAcknowledgement(const Start& start, const AcknowledgementAnswer& answer) {
  if (start->isOver) return;
  start->alert.reset();
  if (!answer.allowed) {
    QV_LOG(logs::kDaemon, "user declined");
    refuseStart(start, _qvUserErrorForCode(errorcode::kUserDeclined));
    return;
  }
  start->microphoneRecording = answer.microphone;
  start->cameraRecording = answer.camera;
  exemptions_.updateExemptionListWithSession(start->session->bundleID(), answer.microphone);
  beginRecording(start);
}

}  // namespace qv
