#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/UserAlert.h"
#include "support/QVBundleTexts.h"

namespace qv {

/// What a start asks the user's consent for.
struct AcknowledgementRequest {
  std::string bundleID;
  bool capture = false;  ///< the samples go to the application instead of a movie
  bool microphone = false;
  bool camera = false;
};

/// What the user allowed.
struct AcknowledgementAnswer {
  bool allowed = false;
  bool microphone = false;
  bool camera = false;
};

/// Asks users for their consent.
///
/// Threading: called on the manager sequence.
class QVAcknowledgementAlert {
 public:
  /// Both are borrowed, and must outlive the alerts.
  QVAcknowledgementAlert(platform::UserAlertService& alerts, const QVBundleTexts& texts)
      : alerts_(alerts), texts_(texts) {}

  /// Asks the user whether an application may record its screen.
  ///
  /// Without microphone and camera there are two buttons: record (default) and decline (other). With
  /// one of them there are three: decline (default), record with what was asked (alternate), record
  /// without (other). Closing the alert in any other way declines, and so does an alert that cannot
  /// be shown.
  ///
  /// The handler comes on a thread of the alert service's, or at once when the alert cannot be shown. Destroying the
  /// returned alert takes it away.
  [[nodiscard]] std::unique_ptr<platform::UserAlert> present(const AcknowledgementRequest& request,
                                                             std::function<void(AcknowledgementAnswer)> handler) const;

 private:
  [[nodiscard]] platform::UserAlertRequest buildAlert(const AcknowledgementRequest& request) const;

  platform::UserAlertService& alerts_;
  const QVBundleTexts& texts_;
};

}  // namespace qv
