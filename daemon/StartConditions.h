#pragma once

#include <string>

#include "daemon/ForegroundFollower.h"
#include "daemon/SessionRegistry.h"
#include "daemon/StatusView.h"
#include "protocol/QVStatusProtocol.h"
#include "ui/QVExemptionBook.h"

namespace qv {

/// What a start would find now, by the same measures as a start: it changes nothing that records.
///
/// Each condition has its name, whether it is met, and a text in English; the code too, with which a start would be
/// refused. A condition that is not met and has no code does not keep a recording from starting.
///
/// Threading: sequence only; what it is given is borrowed.
class StartConditions {
 public:
  StartConditions(RecordingContext& context, SessionRegistry& sessions, ForegroundFollower& foreground,
                  const QVExemptionBook& exemptions)
      : context_(context), sessions_(sessions), foreground_(foreground), exemptions_(exemptions) {}

  [[nodiscard]] platform::Array of(const status::GetStartConditions& request, const StatusView& view,
                                   const platform::DeviceServices& services) const;
  [[nodiscard]] platform::Value space() const;
  [[nodiscard]] platform::Value store() const;

 private:
  [[nodiscard]] platform::Value bundle(const std::string& bundleID) const;
  [[nodiscard]] platform::Value entitlement(const std::string& bundleID, uid_t user) const;
  [[nodiscard]] platform::Value foreground(const std::string& bundleID) const;
  [[nodiscard]] platform::Value consent(const std::string& bundleID, uid_t user, bool withMicrophone) const;
  [[nodiscard]] platform::Value microphone() const;

  RecordingContext& context_;
  SessionRegistry& sessions_;
  ForegroundFollower& foreground_;
  const QVExemptionBook& exemptions_;
};

}  // namespace qv
