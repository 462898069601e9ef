#include "platform/headless/HeadlessAlerts.h"

#include <cstdlib>
#include <mutex>
#include <string_view>
#include <utility>

#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform {
namespace {

UserAlertAnswer buttonNamed(std::string_view name, bool hasAlternate) {
  if (name == "accept") return hasAlternate ? UserAlertAnswer::Alternate : UserAlertAnswer::Default;
  if (name == "decline") return hasAlternate ? UserAlertAnswer::Default : UserAlertAnswer::Other;
  if (name == "default") return UserAlertAnswer::Default;
  if (name == "alternate") return UserAlertAnswer::Alternate;
  if (name == "other") return UserAlertAnswer::Other;
  return UserAlertAnswer::Cancelled;
}

bool isShown(UserAlertAnswer answer, const UserAlertRequest& request) {
  switch (answer) {
    case UserAlertAnswer::Default:
      return !request.defaultButton.empty();
    case UserAlertAnswer::Alternate:
      return !request.alternateButton.empty();
    case UserAlertAnswer::Other:
      return !request.otherButton.empty();
    case UserAlertAnswer::Cancelled:
      return true;
  }
  return false;
}

/// Threading: thread-safe.
class StandingAlert {
 public:
  explicit StandingAlert(std::function<void(UserAlertAnswer)> handler) : handler_(std::move(handler)) {}
  void answer(UserAlertAnswer answer) {
    if (const auto handler = take()) handler(answer);
  }
  std::function<void(UserAlertAnswer)> take() {
    std::lock_guard lock(mutex_);
    return std::exchange(handler_, nullptr);
  }

 private:
  std::mutex mutex_;
  std::function<void(UserAlertAnswer)> handler_;
};

/// Threading: as UserAlert.
class HeadlessAlert final : public UserAlert {
 public:
  explicit HeadlessAlert(std::shared_ptr<StandingAlert> alert) : alert_(std::move(alert)) {}
  ~HeadlessAlert() override { alert_->take(); }

 private:
  const std::shared_ptr<StandingAlert> alert_;
};

}  // namespace

std::optional<UserAlertAnswer> alertAnswerFromEnvironment(const UserAlertRequest& request) {
  const char* value = std::getenv("QUORVEL_HEADLESS_ALERT");
  const std::string_view name = value ? value : "cancel";
  if (name == "never") return std::nullopt;
  const UserAlertAnswer answer = buttonNamed(name, !request.alternateButton.empty());
  return isShown(answer, request) ? answer : UserAlertAnswer::Cancelled;
}

std::unique_ptr<UserAlert> HeadlessAlerts::present(const UserAlertRequest& request,
                                                   std::function<void(UserAlertAnswer)> handler) {
  auto alert = std::make_shared<StandingAlert>(std::move(handler));
  globalQueue().post([alert, policy = policy_, request] {
    const auto answer = policy(request);
    QV_LOG_INFO(logs::kUI, "headless alert \"%s\": %s %d", request.header.c_str(), answer ? "answer" : "no answer",
                answer ? static_cast<int>(*answer) : 0);
    if (answer) alert->answer(*answer);
  });
  return std::make_unique<HeadlessAlert>(std::move(alert));
}

}  // namespace qv::platform
