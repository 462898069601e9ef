#include "ui/StopRecordingAlert.h"

#include <utility>

#include "platform/threads/Log.h"
#include "ui/FormattedText.h"

namespace qv {

using platform::UserAlertAnswer;
namespace logs = platform::logs;

std::unique_ptr<platform::UserAlert> StopRecordingAlert::present(const std::string& broadcastServiceName,
                                                                 std::function<void(bool)> handler) const {
  platform::UserAlertRequest request;
  request.header =
      broadcastServiceName.empty()
          ? texts_.localizedText("STOP_RECORDING_ALERT_QUESTION")
          : formatted(texts_.localizedText("STOP_BROADCASTING_ALERT_QUESTION_FORMAT"), broadcastServiceName);
  request.defaultButton = texts_.localizedText("STOP_ALERT_STOP_BUTTON");
  request.otherButton = texts_.localizedText("STOP_ALERT_CONTINUE_BUTTON");
  if (const auto framework = texts_._qvFrameworkBundle()) request.localizationPath = framework->path();
  auto alert = alerts_.present(
      request, [handler = std::move(handler)](UserAlertAnswer answer) { handler(answer == UserAlertAnswer::Default); });
  if (!alert) QV_LOG_ERROR(logs::kUI, "the user cannot be asked whether to stop");
  return alert;
}

}  // namespace qv
