#include "ui/QVExemptionBook.h"

#include "platform/threads/Log.h"

namespace qv {

namespace {
constexpr double kExemptionSeconds = 480.0;
}

bool QVExemptionBook::isExemptFromAcknowledgementAlertSession(const std::string& bundleID, bool withMicrophone) const {
  return withMicrophone ? exemptWithMicRecordingEnabledBundleIdentifiers_.contains(bundleID)
                        : exemptBundleIdentifiers_.contains(bundleID);
}

void QVExemptionBook::updateExemptionListWithSession(const std::string& bundleID, bool withMicrophone) {
  if (withMicrophone) exemptWithMicRecordingEnabledBundleIdentifiers_.insert(bundleID);
  exemptBundleIdentifiers_.insert(bundleID);
}

void QVExemptionBook::noteBackground(const std::string& bundleID, platform::Date now) {
  lastBackgroundDateByBundleIdentifier_.emplace(bundleID, now);
}

void QVExemptionBook::expireAcknowledgementExemptionsForBundleID(const std::string& bundleID, platform::Date now) {
  QV_LOG(platform::logs::kUI, "QVRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:");
  const auto background = lastBackgroundDateByBundleIdentifier_.find(bundleID);
  if (background == lastBackgroundDateByBundleIdentifier_.end()) return;
  if (!(now.secondsSince1970 - background->second.secondsSince1970 > kExemptionSeconds)) return;
  exemptBundleIdentifiers_.erase(bundleID);
  exemptWithMicRecordingEnabledBundleIdentifiers_.erase(bundleID);
  lastBackgroundDateByBundleIdentifier_.erase(background);
  QV_LOG(platform::logs::kUI, "removedExemption");
}

}  // namespace qv
