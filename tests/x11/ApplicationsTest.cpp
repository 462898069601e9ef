#include <map>
#include <mutex>

#include "platform/x11/X11Platform.h"
#include "tests/kit/ApplicationReport.h"
#include "tests/kit/Events.h"
#include "tests/kit/XServer.h"

namespace qv::platform {
namespace {

using Report = kit::ApplicationReport;
using kit::WindowProcess;
using kit::XServer;

constexpr char kGame[] = "com.example.game";
constexpr char kFilm[] = "com.example.film";

class ApplicationsTest : public kit::XServerTest {
 protected:
  void SetUp() override {
    XServerTest::SetUp();
    if (!IsSkipped()) open(display());
  }
  void open(const std::string& name) {
    display_ = name;
    X11Dependencies dependencies;
    dependencies.bundleIdentifierOfProcess = [this](pid_t pid) -> std::optional<std::string> {
      std::lock_guard lock(mutex_);
      auto found = bundles_.find(pid);
      if (found == bundles_.end()) return std::nullopt;
      return found->second;
    };
    platform_ = std::move(X11Platform::connect(name, dependencies).value());
    monitor_ = platform_->applications().createStateMonitor();
    client_ = std::make_unique<kit::XClient>(name);
  }
  std::unique_ptr<WindowProcess> launch(const std::string& bundleID) {
    // Held while the window comes up: a monitor that sees it before its bundle is known waits, as on a
    // device, where a process has its bundle from the start.
    std::lock_guard lock(mutex_);
    auto process = std::make_unique<WindowProcess>(display_);
    bundles_[process->pid()] = bundleID;
    return process;
  }
  void watch() {
    monitor_->setHandler([this](const Dictionary& report) { reports_.add(Report::decode(report)); });
  }
  uint32_t stateOf(const std::string& bundleID) { return monitor_->applicationStateForBundleIdentifier(bundleID); }
  std::optional<std::string> frontmost() { return platform_->applications().frontmostApplication(); }
  /// Waits for the report that an application is in front.
  void waitForFront(const std::string& bundleID) {
    reports_.nextWhere([&](const Report& report) { return report.bundleID == bundleID && report.isFrontmost; });
  }

  std::string display_;
  std::mutex mutex_;
  std::map<pid_t, std::string> bundles_;
  kit::Events<Report> reports_;
  std::unique_ptr<X11Platform> platform_;
  std::unique_ptr<ApplicationStateMonitor> monitor_;
  std::unique_ptr<kit::XClient> client_;
};

TEST_F(ApplicationsTest, KnowsTheFrontWithoutWindowManager) {
  EXPECT_EQ(frontmost(), std::nullopt);
  auto game = launch(kGame), film = launch(kFilm);
  EXPECT_EQ(frontmost(), kFilm) << "topmost, and nobody has the focus";
  client_->raise(game->window());
  EXPECT_EQ(frontmost(), kGame);
  client_->focus(film->window());
  EXPECT_EQ(frontmost(), kFilm) << "the focus decides";
  EXPECT_EQ(stateOf(kFilm), kApplicationForeground);
  EXPECT_EQ(stateOf(kGame), kApplicationBackground);
  EXPECT_EQ(stateOf("com.example.none"), kApplicationUnknown);
  WindowProcess stranger(display_);
  client_->focus(stranger.window());
  EXPECT_EQ(frontmost(), std::nullopt) << "who is in front belongs to no bundle";
  EXPECT_EQ(stateOf(kFilm), kApplicationBackground);
}

TEST_F(ApplicationsTest, ReportsChangesWithoutWindowManager) {
  auto game = launch(kGame), film = launch(kFilm);
  client_->focus(game->window());
  watch();
  client_->focus(film->window());
  EXPECT_EQ(reports_.next(), (Report{kGame, game->pid(), false, kApplicationBackground}));
  EXPECT_EQ(reports_.next(), (Report{kFilm, film->pid(), true, kApplicationForeground}));
  auto second = std::make_unique<WindowProcess>(display_);  // of no bundle: nothing to report
  client_->unmap(second->window());
  const pid_t filmProcess = film->pid();
  film->kill();  // the focus goes to nobody: the topmost visible window counts
  EXPECT_EQ(reports_.next(), (Report{kFilm, filmProcess, false, kApplicationTerminated}));
  EXPECT_EQ(reports_.next(), (Report{kGame, game->pid(), true, kApplicationForeground}));
  EXPECT_EQ(stateOf(kFilm), kApplicationUnknown);
  auto third = launch("com.example.third");
  client_->raise(third->window());
  EXPECT_EQ(reports_.next(), (Report{kGame, game->pid(), false, kApplicationBackground}));
  EXPECT_EQ(reports_.next(), (Report{"com.example.third", third->pid(), true, kApplicationForeground}));
}

TEST_F(ApplicationsTest, FollowsTheWindowManager) {
  if (!kit::isInstalled("openbox") || !kit::isInstalled("xdotool"))
    GTEST_SKIP() << "openbox or xdotool is not installed";
  XServer own;
  open(own.display());
  auto game = launch(kGame), film = launch(kFilm);
  watch();  // the film is the topmost: only the game's coming to the front is certain to be a change
  kit::WindowManager manager(display_);
  const auto activate = [&](const WindowProcess& process) {
    ASSERT_TRUE(kit::activateWindow(display_, process.window()));
  };
  activate(*game);
  waitForFront(kGame);
  EXPECT_EQ(stateOf(kGame), kApplicationForeground);
  activate(*film);
  waitForFront(kFilm);
  EXPECT_EQ(stateOf(kGame), kApplicationBackground);
  EXPECT_EQ(stateOf(kFilm), kApplicationForeground);
  activate(*game);
  waitForFront(kGame);
  EXPECT_EQ(frontmost(), kGame);
  activate(*film);
  waitForFront(kFilm);
  monitor_->setHandler({});
  manager.kill();  // its properties stay behind, and say that the film is active
  client_->raise(game->window());
  client_->focus(game->window());
  EXPECT_EQ(frontmost(), kGame);
}

TEST_F(ApplicationsTest, NobodyIsInFrontOfALostServer) {
  XServer mortal;
  open(mortal.display());
  auto game = launch(kGame);
  client_->focus(game->window());
  EXPECT_EQ(frontmost(), kGame);
  watch();
  mortal.kill();
  EXPECT_EQ(reports_.next(), (Report{kGame, game->pid(), false, kApplicationBackground}));
  EXPECT_EQ(frontmost(), std::nullopt);
  EXPECT_EQ(stateOf(kGame), kApplicationUnknown);
  const pid_t process = game->pid();
  game->kill();
  EXPECT_EQ(reports_.next(), (Report{kGame, process, false, kApplicationTerminated}));
}

}  // namespace
}  // namespace qv::platform
