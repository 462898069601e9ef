#include <future>

#include "platform/x11/X11Platform.h"
#include "tests/kit/XServer.h"

namespace qv::platform {
namespace {

using namespace std::chrono_literals;
using kit::XServer;

class UserAlertTest : public kit::XServerTest {
 protected:
  void SetUp() override {
    XServerTest::SetUp();
    if (IsSkipped()) return;
    if (!kit::isInstalled("zenity") || !kit::isInstalled("xdotool"))
      GTEST_SKIP() << "zenity or xdotool is not installed";
    open(display());
  }
  void open(const std::string& name) {
    display_ = name;
    platform_ = std::move(X11Platform::connect(name, {}).value());
    user_ = std::make_unique<kit::XClient>(name);
  }
  std::unique_ptr<UserAlert> present(const UserAlertRequest& request) {
    answer_ = {};
    return platform_->alerts().present(request, [this](UserAlertAnswer answer) { answer_.set_value(answer); });
  }
  /// Presents the alert, presses keys once it has the keyboard, and tells the answer.
  UserAlertAnswer answerByKeys(const UserAlertRequest& request, std::initializer_list<const char*> keys) {
    auto alert = present(request);
    EXPECT_TRUE(alert);
    auto answer = answer_.get_future();
    user_->waitForFocusedWindow(request.header);
    EXPECT_TRUE(kit::pressKeys(display_, keys));
    if (answer.wait_for(30s) != std::future_status::ready) {
      ADD_FAILURE() << "no answer";
      return UserAlertAnswer::Cancelled;
    }
    return answer.get();
  }

  const UserAlertRequest twoButtons_{
      "Record <b>Tom & Jerry</b>?", "A \\n text_with --everything", "_Allow & go", "", "Don't allow", ""};
  std::string display_;
  std::promise<UserAlertAnswer> answer_;
  std::unique_ptr<X11Platform> platform_;
  std::unique_ptr<kit::XClient> user_;
};

TEST_F(UserAlertTest, TextsArePlainAndTheSafeButtonHasTheKeyboard) {
  EXPECT_EQ(answerByKeys(twoButtons_, {"Return"}), UserAlertAnswer::Other);
  EXPECT_EQ(answerByKeys(twoButtons_, {"Right", "Return"}), UserAlertAnswer::Default);
}

TEST_F(UserAlertTest, AWindowThatIsDestroyedCancels) {
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
  if (!kit::isInstalled("openbox")) GTEST_SKIP() << "openbox is not installed";
  XServer own;
  open(own.display());
  const kit::WindowProcess game(display_);
  kit::WindowManager manager(display_);
  ASSERT_TRUE(kit::activateWindow(display_, game.window()));
  user_->waitForFocus(game.window());
  EXPECT_TRUE(kit::pressKeys(display_, {"a"}));  // the user is busy with it
  EXPECT_EQ(answerByKeys(twoButtons_, {"Right", "Return"}), UserAlertAnswer::Default);
  user_->waitForFocus(game.window());
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
}  // namespace qv::platform
