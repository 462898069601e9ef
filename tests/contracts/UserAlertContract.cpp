#include <future>
#include <map>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/x11/X11Platform.h"
#include "tests/contracts/Backends.h"
#include "tests/kit/Events.h"
#include "tests/kit/XServer.h"

namespace qv::contracts {
namespace {

using namespace platform;
using enum UserAlertAnswer;

const UserAlertRequest kTwoButtons{"Record?", "text", "Record", "", "Refuse", ""};
const UserAlertRequest kThreeButtons{"Record more?", "text", "Refuse", "With microphone", "Screen only", ""};

/// A device whose user waits for an alert and answers it.
struct AlertStage {
  virtual ~AlertStage() = default;
  virtual UserAlertService& alerts() = 0;
  virtual void waitFor(const UserAlertRequest& request) = 0;
  virtual void answer(const UserAlertRequest& request, UserAlertAnswer answer) = 0;
};

class HeadlessStage final : public AlertStage {
  UserAlertService& alerts() override { return platform_.userAlerts(); }
  void waitFor(const UserAlertRequest&) override { user_->asked.next(); }
  void answer(const UserAlertRequest& request, UserAlertAnswer answer) override {
    user_->answers.at(request.header).add(answer);
  }
  /// May be asked for longer than there is a stage.
  struct User {
    User() {
      for (const auto* request : {&kTwoButtons, &kThreeButtons}) answers[request->header];
    }
    kit::Events<bool> asked;
    std::map<std::string, kit::Events<UserAlertAnswer>> answers;
  };
  const std::shared_ptr<User> user_ = std::make_shared<User>();
  HeadlessPlatform platform_{
      {.alertPolicy = [user = user_](const UserAlertRequest& request) -> std::optional<UserAlertAnswer> {
        user->asked.add(true);
        return user->answers.at(request.header).next();
      }}};
};

class X11Stage final : public AlertStage {
  UserAlertService& alerts() override { return platform_->alerts(); }
  void waitFor(const UserAlertRequest& request) override { user_.waitForFocusedWindow(request.header); }
  void answer(const UserAlertRequest& request, UserAlertAnswer answer) override {
    // The refusing button comes first: the default one beside an alternate one, else the other.
    const bool isFirst = answer == (request.alternateButton.empty() ? Other : Default);
    const bool isThird = answer == Other && !isFirst;
    const auto& display = server_.display();
    ASSERT_TRUE(answer == Cancelled ? kit::pressKeys(display, {"Escape"})
                : isFirst           ? kit::pressKeys(display, {"Return"})
                : isThird           ? kit::pressKeys(display, {"Right", "Right", "Return"})
                                    : kit::pressKeys(display, {"Right", "Return"}));
  }
  kit::XServer server_;
  kit::XClient user_{server_.display()};
  const std::unique_ptr<X11Platform> platform_ = std::move(X11Platform::connect(server_.display(), {}).value());
};

class UserAlertContract : public ContractTest<AlertStage> {};
INSTANTIATE_TEST_SUITE_P(, UserAlertContract,
                         testing::Values(Backend<AlertStage>{"headless", make<AlertStage, HeadlessStage>},
                                         Backend<AlertStage>{
                                             "x11", make<AlertStage, X11Stage>, {"Xvfb", "zenity", "xdotool"}}),
                         kNameOfBackend);

TEST_P(UserAlertContract, EachButtonHasItsAnswer) {
  const std::pair<const UserAlertRequest&, UserAlertAnswer> cases[] = {
      {kTwoButtons, Default},     {kTwoButtons, Other},   {kTwoButtons, Cancelled},  {kThreeButtons, Default},
      {kThreeButtons, Alternate}, {kThreeButtons, Other}, {kThreeButtons, Cancelled}};
  for (const auto& [request, answer] : cases) {
    kit::Events<UserAlertAnswer> answers;
    const auto alert = stage_->alerts().present(request, [&](UserAlertAnswer given) { answers.add(given); });
    ASSERT_TRUE(alert);
    stage_->waitFor(request);
    EXPECT_TRUE(answers.isEmpty());
    stage_->answer(request, answer);
    EXPECT_EQ(answers.next(), answer) << request.header;
  }
}

TEST_P(UserAlertContract, AnAlertTakenAwayDoesNotAnswer) {
  kit::Events<std::string> answers;
  auto alert = stage_->alerts().present(kTwoButtons, [&](UserAlertAnswer) { answers.add("first"); });
  ASSERT_TRUE(alert);
  stage_->waitFor(kTwoButtons);
  alert.reset();
  alert = stage_->alerts().present(kThreeButtons, [&](UserAlertAnswer) { answers.add("second"); });
  stage_->waitFor(kThreeButtons);
  stage_->answer(kThreeButtons, Default);
  EXPECT_EQ(answers.next(), "second");
  stage_->answer(kTwoButtons, Other);
  EXPECT_TRUE(answers.isEmpty());
}

TEST_P(UserAlertContract, ItsHandlerMayDestroyIt) {
  kit::Events<bool> answers;
  std::promise<std::unique_ptr<UserAlert>> handle;
  handle.set_value(stage_->alerts().present(kTwoButtons, [&](UserAlertAnswer) {
    handle.get_future().get().reset();
    answers.add(true);
  }));
  stage_->waitFor(kTwoButtons);
  stage_->answer(kTwoButtons, Other);
  EXPECT_TRUE(answers.next());
}

}  // namespace
}  // namespace qv::contracts
