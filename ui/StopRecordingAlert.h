#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/UserAlert.h"
#include "support/QVBundleTexts.h"

namespace qv {

/// Asks the user, who has pressed the indicator, whether what goes on is to end.
///
/// Threading: called on the manager sequence.
class StopRecordingAlert {
 public:
  /// Both are borrowed, and must outlive the alerts.
  StopRecordingAlert(platform::UserAlertService& alerts, const QVBundleTexts& texts) : alerts_(alerts), texts_(texts) {}

  /// `broadcastServiceName`: where it is broadcast to; empty for a recording. Closing the alert in any way but by its
  /// button lets the recording go on. The handler comes on a thread of the alert service's; destroying the alert takes
  /// it away. Nothing where it cannot be shown.
  [[nodiscard]] std::unique_ptr<platform::UserAlert> present(const std::string& broadcastServiceName,
                                                             std::function<void(bool isToStop)> handler) const;

 private:
  platform::UserAlertService& alerts_;
  const QVBundleTexts& texts_;
};

}  // namespace qv
