#pragma once

#include "platform/UserAlert.h"

namespace qv::platform {

/// Decides about an alert: an answer, or nothing to leave it standing until it is taken away.
using AlertPolicy = std::function<std::optional<UserAlertAnswer>(const UserAlertRequest&)>;

/// Answers as the environment variable QUORVEL_HEADLESS_ALERT says, read anew for each alert:
/// - `accept`: the button that lets a recording begin, with the microphone where that is a choice.
///   With an alternate button that is the alternate one, else the default one;
/// - `decline`: the button that refuses: the default one beside an alternate button, else the other;
/// - `default`, `alternate`, `other`: that button;
/// - `cancel`: none;
/// - `never`: the alert stands until it is taken away.
/// Without the variable, with another value, or where the button is not shown, the alert is
/// cancelled: a device in front of which nobody sits does not consent.
std::optional<UserAlertAnswer> alertAnswerFromEnvironment(const UserAlertRequest& request);

/// Alerts that answer themselves.
///
/// Threading: thread-safe. Policy and handler are called on the global queue, never inside `present`.
class HeadlessAlerts final : public UserAlertService {
 public:
  explicit HeadlessAlerts(AlertPolicy policy) : policy_(std::move(policy)) {}
  std::unique_ptr<UserAlert> present(const UserAlertRequest& request,
                                     std::function<void(UserAlertAnswer)> handler) override;

 private:
  const AlertPolicy policy_;
};

}  // namespace qv::platform
