#include "ui/QVExemptionBook.h"

#include "platform/threads/Log.h"

namespace qv {

namespace {
constexpr double kExemptionSeconds = 480.0;
}

bool QVExemptionBook::isExemptFromAcknowledgementAlertSession(const std::string& owner, bool withMicrophone) const {
  return withMicrophone ? exemptWithMicRecordingEnabledBundleIdentifiers_.contains(owner)
                        : exemptBundleIdentifiers_.contains(owner);
}

void QVExemptionBook::updateExemptionListWithSession(const std::string& owner, bool withMicrophone) {
  if (withMicrophone) exemptWithMicRecordingEnabledBundleIdentifiers_.insert(owner);
  exemptBundleIdentifiers_.insert(owner);
}

void QVExemptionBook::noteBackground(const std::string& owner, platform::Date now) {
  lastBackgroundDateByBundleIdentifier_.emplace(owner, now);
}

void QVExemptionBook::expireAcknowledgementExemptionsForBundleID(const std::string& owner, platform::Date now) {
  QV_LOG(platform::logs::kUI, "QVRecordingManager:removeAcknowledgementExemptionIfOverThreshholdForBundleID:");
  const auto background = lastBackgroundDateByBundleIdentifier_.find(owner);
  if (background == lastBackgroundDateByBundleIdentifier_.end()) return;
  if (!(now.secondsSince1970 - background->second.secondsSince1970 > kExemptionSeconds)) return;
  exemptBundleIdentifiers_.erase(owner);
  exemptWithMicRecordingEnabledBundleIdentifiers_.erase(owner);
  lastBackgroundDateByBundleIdentifier_.erase(background);
  QV_LOG(platform::logs::kUI, "removedExemption");
}

}  // namespace qv
