#pragma once

#include <map>
#include <set>
#include <string>

#include "platform/base/Value.h"

namespace qv {

/// Which applications the user has already allowed to record, and until when; by their owners (applicationOwner).
///
/// An exemption lasts until the application connects or becomes active more than 480 s after it
/// first went to the background. Allowed with the microphone means allowed without it, too. Kept
/// in memory only: a new daemon asks again.
///
/// Threading: manager sequence only.
class QVExemptionBook {
 public:
  [[nodiscard]] bool isExemptFromAcknowledgementAlertSession(const std::string& owner, bool withMicrophone) const;
  void updateExemptionListWithSession(const std::string& owner, bool withMicrophone);
  /// Only the first move to the background since the last expiry counts.
  void noteBackground(const std::string& owner, platform::Date now);
  void expireAcknowledgementExemptionsForBundleID(const std::string& owner, platform::Date now);

 private:
  std::set<std::string> exemptBundleIdentifiers_;
  std::set<std::string> exemptWithMicRecordingEnabledBundleIdentifiers_;
  std::map<std::string, platform::Date> lastBackgroundDateByBundleIdentifier_;
};

}  // namespace qv
