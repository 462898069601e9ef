#include "ui/QVAcknowledgementAlert.h"

#include "platform/threads/Log.h"
#include "ui/FormattedText.h"

namespace qv {

using platform::UserAlertAnswer;
using platform::UserAlertRequest;
namespace logs = platform::logs;

namespace {

AcknowledgementAnswer acceptedWithout(const AcknowledgementRequest& request) {
  QV_LOG(logs::kUI, "%s",
         request.camera ? "user acknowledged recording, but camera recording is disabled"
                        : "user acknowledged recording, but microphone recording is disabled");
  return {true, false, false};
}

AcknowledgementAnswer interpret(const AcknowledgementRequest& request, UserAlertAnswer answer) {
  const bool threeButtons = request.camera || request.microphone;
  const UserAlertAnswer without = threeButtons ? UserAlertAnswer::Other : UserAlertAnswer::Default;
  if (answer == without) return acceptedWithout(request);
  if (threeButtons && answer == UserAlertAnswer::Alternate) {
    QV_LOG(logs::kUI, "user acknowledged recording");
    return {true, request.microphone, request.camera};
  }
  QV_LOG(logs::kUI, "user refused recording");
  return {};
}

}  // namespace

UserAlertRequest QVAcknowledgementAlert::buildAlert(const AcknowledgementRequest& request) const {
  const std::string name = texts_._qvLocalizedAppNameFromBundleID(request.bundleID).value_or(request.bundleID);
  UserAlertRequest alert;
  alert.header = formatted(
      texts_.localizedText(request.capture ? "ACKNOWLEDGEMENT_CAPTURE_ALERT_TITLE" : "ACKNOWLEDGEMENT_ALERT_TITLE"),
      name);
  alert.message =
      texts_.localizedText(request.capture ? "ACKNOWLEDGEMENT_CAPTURE_ALERT_BODY_TV" : "ACKNOWLEDGEMENT_ALERT_BODY_TV");
  if (request.camera || request.microphone) {
    alert.message += " " + texts_.localizedText(request.camera ? "ACKNOWLEDGEMENT_ALERT_BODY_CAMERA"
                                                               : "ACKNOWLEDGEMENT_ALERT_BODY_MIC");
    alert.alternateButton = texts_.localizedText(request.camera ? "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_CAMERA"
                                                                : "ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1");
    alert.otherButton = texts_.localizedText("ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_2");
    alert.defaultButton = texts_.localizedText("ACKNOWLEDGEMENT_ALERT_DECLINE_BUTTON");
  } else {
    alert.defaultButton = texts_.localizedText("ACKNOWLEDGEMENT_ALERT_ACCEPT_BUTTON_1_MICROPHONE_DISABLED");
    alert.otherButton = texts_.localizedText("ACKNOWLEDGEMENT_ALERT_DECLINE_BUTTON");
  }
  if (const auto framework = texts_._qvFrameworkBundle()) alert.localizationPath = framework->path();
  return alert;
}

std::unique_ptr<platform::UserAlert> QVAcknowledgementAlert::present(
    const AcknowledgementRequest& request, std::function<void(AcknowledgementAnswer)> handler) const {
  auto alert = alerts_.present(buildAlert(request),
                               [request, handler](UserAlertAnswer answer) { handler(interpret(request, answer)); });
  if (!alert) {
    QV_LOG_ERROR(logs::kUI, "error showing acknowledgement alert");
    handler({});
  }
  return alert;
}

}  // namespace qv
