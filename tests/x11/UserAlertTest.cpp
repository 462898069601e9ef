#include <signal.h>

#include <future>

#include "platform/x11/X11Platform.h"
#include "tests/x11/XServer.h"

namespace qv::platform::testing {
namespace {

using namespace std::chrono_literals;

class UserAlertTest : public XServerTest {
 protected:
  void SetUp() override {
    XServerTest::SetUp();
    if (IsSkipped()) return;
    if (!hasProgram("zenity") || !hasProgram("xdotool")) GTEST_SKIP() << "zenity or xdotool is not installed";
    open(display());
  }
  void open(const std::string& name) {
    display_ = name;
    platform_ = std::move(X11Platform::connect(name, {}).value());
    user_ = std::make_unique<XClient>(name);
  }
  std::unique_ptr<UserAlert> present(const UserAlertRequest& request) {
    answer_ = {};
    return platform_->alerts().present(request, [this](UserAlertAnswer answer) { answer_.set_value(answer); });
  }
  void press(const std::vector<std::string>& keys) {
    std::vector<std::string> arguments{"xdotool", "key", "--delay", "100"};
    arguments.insert(arguments.end(), keys.begin(), keys.end());
    ASSERT_EQ(ChildProcess(arguments, {"DISPLAY=" + display_}).wait(), 0);
  }
  /// Presents the alert, presses keys once it has the keyboard, and tells the answer.
  UserAlertAnswer answerByKeys(const UserAlertRequest& request, const std::vector<std::string>& keys) {
    auto alert = present(request);
    EXPECT_TRUE(alert);
    auto answer = answer_.get_future();
    user_->waitForFocusedWindow(request.header);
    press(keys);
    if (answer.wait_for(30s) != std::future_status::ready) {
      ADD_FAILURE() << "no answer";
      return UserAlertAnswer::Cancelled;
    }
    return answer.get();
  }

  const UserAlertRequest twoButtons_{
      "Record <b>Tom & Jerry</b>?", "A \\n text_with --everything", "_Allow & go", "", "Don't allow", ""};
  const UserAlertRequest threeButtons_{"-Record?", "text", "Refuse", "With camera", "Without", ""};
  std::string display_;
  std::promise<UserAlertAnswer> answer_;
  std::unique_ptr<X11Platform> platform_;
  std::unique_ptr<XClient> user_;
};

TEST_F(UserAlertTest, ReturnRefuses) {
  EXPECT_EQ(answerByKeys(twoButtons_, {"Return"}), UserAlertAnswer::Other);
  EXPECT_EQ(answerByKeys(threeButtons_, {"Return"}), UserAlertAnswer::Default);
}

TEST_F(UserAlertTest, EveryButtonCanBeReached) {
  EXPECT_EQ(answerByKeys(twoButtons_, {"Right", "Return"}), UserAlertAnswer::Default);
  EXPECT_EQ(answerByKeys(threeButtons_, {"Right", "Return"}), UserAlertAnswer::Alternate);
  EXPECT_EQ(answerByKeys(threeButtons_, {"Right", "Right", "Return"}), UserAlertAnswer::Other);
}

TEST_F(UserAlertTest, EverythingElseCancels) {
  EXPECT_EQ(answerByKeys(twoButtons_, {"Escape"}), UserAlertAnswer::Cancelled);
  auto alert = present(twoButtons_);
  const auto window = user_->waitForFocusedWindow(twoButtons_.header);
  user_->destroy(window);  // by another client; the program takes this for a confirmation
  EXPECT_EQ(answer_.get_future().get(), UserAlertAnswer::Cancelled);
}

TEST_F(UserAlertTest, GivesTheKeyboardBack) {
  const auto game = user_->show({});
  user_->focus(game);
  EXPECT_EQ(answerByKeys(twoButtons_, {"Return"}), UserAlertAnswer::Other);
  EXPECT_EQ(user_->focused(), game) << "at the latest when the handler is called";
}

TEST_F(UserAlertTest, TakesAndReturnsTheKeyboardUnderAWindowManager) {
  if (!WindowManager::isInstalled()) GTEST_SKIP() << "openbox is not installed";
  XServer own;
  open(own.display());
  const WindowProcess game(display_);
  WindowManager manager(display_);
  ASSERT_TRUE(activateWindow(display_, game.window()));
  user_->waitForFocus(game.window());
  press({"a"});  // the user is busy with it
  EXPECT_EQ(answerByKeys(twoButtons_, {"Right", "Return"}), UserAlertAnswer::Default);
  user_->waitForFocus(game.window());
}

TEST_F(UserAlertTest, DestroyingTakesTheAlertAwayWithoutAnAnswer) {
  auto alert = present(twoButtons_);
  auto answer = answer_.get_future();
  const auto window = user_->waitForFocusedWindow(twoButtons_.header);
  const auto process = platform_->renderServer().ownerOfContext(window);
  ASSERT_TRUE(process);
  alert.reset();
  EXPECT_EQ(::kill(*process, 0), -1) << "it was waited for";
  EXPECT_EQ(answer.wait_for(0s), std::future_status::timeout);
}

TEST_F(UserAlertTest, MayBeDestroyedByItsHandler) {
  std::promise<std::unique_ptr<UserAlert>> handle;
  auto alertInHandler = handle.get_future();
  std::promise<void> done;
  handle.set_value(platform_->alerts().present(threeButtons_, [&](UserAlertAnswer) {
    alertInHandler.get().reset();
    done.set_value();
  }));
  user_->waitForFocusedWindow(threeButtons_.header);
  press({"Return"});
  EXPECT_EQ(done.get_future().wait_for(30s), std::future_status::ready);
}

TEST_F(UserAlertTest, CannotBeShownWithoutDisplayButtonOrProgram) {
  EXPECT_FALSE(present({"title", "text", "", "", "", ""}));
  const std::string path = std::getenv("PATH");
  ::setenv("PATH", "/nonexistent", 1);
  EXPECT_FALSE(present(twoButtons_));
  ::setenv("PATH", path.c_str(), 1);
  XServer mortal;
  auto platform = std::move(X11Platform::connect(mortal.display(), {}).value());
  mortal.kill();
  EXPECT_FALSE(platform->alerts().present(twoButtons_, [](UserAlertAnswer) {}));
}

}  // namespace
}  // namespace qv::platform::testing
