#include <future>
#include <map>

#include "platform/x11/X11Platform.h"
#include "tests/x11/XServer.h"

namespace qv::platform::testing {
namespace {

using namespace std::chrono_literals;

constexpr char kGame[] = "com.example.game";
constexpr char kFilm[] = "com.example.film";

struct Report {
  std::string bundleID;
  pid_t pid;
  uint32_t state;
  bool isFrontmost;
  bool operator==(const Report&) const = default;
};
std::ostream& operator<<(std::ostream& out, const Report& report) {
  return out << report.bundleID << " state " << report.state << (report.isFrontmost ? " in front" : "");
}

Report decode(const Dictionary& dictionary) {
  return {*dictionary.at(applicationstate::kBundleIDKey).getIf<std::string>(),
          *dictionary.at(applicationstate::kProcessIDKey).getIf<int32_t>(),
          *dictionary.at(applicationstate::kStateKey).getIf<uint32_t>(),
          *dictionary.at(applicationstate::kIsFrontmostKey).getIf<bool>()};
}

class ReportRecorder {
 public:
  void add(const Dictionary& dictionary) {
    std::lock_guard lock(mutex_);
    reports_.push_back(decode(dictionary));
    const auto& report = reports_.back();
    if (report.isFrontmost)
      front_ = report.bundleID;
    else if (front_ == report.bundleID)
      front_.clear();
    changed_.notify_all();
  }
  /// Waits until the reports so far say that this application is in front.
  bool waitForFront(const std::string& bundleID) {
    std::unique_lock lock(mutex_);
    return changed_.wait_for(lock, 20s, [&] { return front_ == bundleID; });
  }
  /// The next `count` reports.
  std::vector<Report> take(size_t count) {
    std::unique_lock lock(mutex_);
    EXPECT_TRUE(changed_.wait_for(lock, 20s, [&] { return reports_.size() >= count; }));
    return std::exchange(reports_, {});
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<Report> reports_;
  std::string front_;
};

class ApplicationsTest : public XServerTest {
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
    client_ = std::make_unique<XClient>(name);
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
    monitor_->setHandler([this](const Dictionary& report) { recorder_.add(report); });
  }
  uint32_t stateOf(const std::string& bundleID) { return monitor_->applicationStateForBundleIdentifier(bundleID); }
  std::optional<std::string> frontmost() { return platform_->applications().frontmostApplication(); }
  Dictionary infoOf(const std::string& bundleID) {
    std::promise<Dictionary> info;
    monitor_->applicationInfoForBundleIdentifier(bundleID, [&](Dictionary d) { info.set_value(std::move(d)); });
    return info.get_future().get();
  }

  std::string display_;
  std::mutex mutex_;
  std::map<pid_t, std::string> bundles_;
  ReportRecorder recorder_;
  std::unique_ptr<X11Platform> platform_;
  std::unique_ptr<ApplicationStateMonitor> monitor_;
  std::unique_ptr<XClient> client_;
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
  EXPECT_EQ(decode(infoOf(kFilm)), (Report{kFilm, film->pid(), kApplicationForeground, true}));
  EXPECT_EQ(infoOf("com.example.none"), Dictionary{});
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
  EXPECT_EQ(recorder_.take(2), (std::vector<Report>{{kGame, game->pid(), kApplicationBackground, false},
                                                    {kFilm, film->pid(), kApplicationForeground, true}}));
  auto second = std::make_unique<WindowProcess>(display_);  // of no bundle: nothing to report
  client_->unmap(second->window());
  const pid_t filmProcess = film->pid();
  film->kill();  // the focus goes to nobody: the topmost visible window counts
  auto reports = recorder_.take(2);
  ASSERT_EQ(reports.size(), 2u);
  EXPECT_EQ(reports[0], (Report{kFilm, filmProcess, kApplicationTerminated, false}));
  EXPECT_EQ(reports[1], (Report{kGame, game->pid(), kApplicationForeground, true}));
  EXPECT_EQ(stateOf(kFilm), kApplicationUnknown);
  auto third = launch("com.example.third");
  client_->raise(third->window());
  reports = recorder_.take(2);
  EXPECT_EQ(reports.back(), (Report{"com.example.third", third->pid(), kApplicationForeground, true}));
}

TEST_F(ApplicationsTest, FollowsTheWindowManager) {
  if (!WindowManager::isInstalled() || !hasProgram("xdotool")) GTEST_SKIP() << "openbox or xdotool is not installed";
  XServer own;
  open(own.display());
  auto game = launch(kGame), film = launch(kFilm);
  watch();  // the film is the topmost: only the game's coming to the front is certain to be a change
  WindowManager manager(display_);
  const auto activate = [&](const WindowProcess& process) { ASSERT_TRUE(activateWindow(display_, process.window())); };
  activate(*game);
  ASSERT_TRUE(recorder_.waitForFront(kGame));
  EXPECT_EQ(stateOf(kGame), kApplicationForeground);
  EXPECT_EQ(decode(infoOf(kGame)), (Report{kGame, game->pid(), kApplicationForeground, true}));
  activate(*film);
  ASSERT_TRUE(recorder_.waitForFront(kFilm));
  EXPECT_EQ(stateOf(kGame), kApplicationBackground);
  EXPECT_EQ(stateOf(kFilm), kApplicationForeground);
  activate(*game);
  ASSERT_TRUE(recorder_.waitForFront(kGame));
  EXPECT_EQ(frontmost(), kGame);
  activate(*film);
  ASSERT_TRUE(recorder_.waitForFront(kFilm));
  monitor_->setHandler({});
  manager.kill();  // its properties stay behind, and say that the film is active
  client_->raise(game->window());
  client_->focus(game->window());
  EXPECT_EQ(frontmost(), kGame);
}

TEST_F(ApplicationsTest, HandlerMayRemoveItself) {
  auto game = launch(kGame), film = launch(kFilm);
  client_->focus(game->window());
  std::promise<void> removed;
  int reports = 0;
  monitor_->setHandler([&](const Dictionary&) {
    ++reports;
    monitor_->setHandler({});
    removed.set_value();
  });
  client_->focus(film->window());  // two reports; the second finds no handler
  removed.get_future().wait();
  watch();
  client_->focus(game->window());
  EXPECT_EQ(recorder_.take(2).back().bundleID, kGame);
  EXPECT_EQ(reports, 1);
}

TEST_F(ApplicationsTest, NobodyIsInFrontOfALostServer) {
  XServer mortal;
  open(mortal.display());
  auto game = launch(kGame);
  client_->focus(game->window());
  EXPECT_EQ(frontmost(), kGame);
  watch();
  mortal.kill();
  EXPECT_EQ(recorder_.take(1).front(), (Report{kGame, game->pid(), kApplicationBackground, false}));
  EXPECT_EQ(frontmost(), std::nullopt);
  EXPECT_EQ(stateOf(kGame), kApplicationUnknown);
  const pid_t process = game->pid();
  game->kill();
  EXPECT_EQ(recorder_.take(1).front(), (Report{kGame, process, kApplicationTerminated, false}));
}

}  // namespace
}  // namespace qv::platform::testing
