#include <algorithm>

#include "platform/threads/Log.h"
#include "platform/x11/WindowLayout.h"
#include "platform/x11/X11Platform.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/kit/Events.h"
#include "tests/kit/XServer.h"

namespace qv::platform {
namespace {

using kit::WindowProcess;
using kit::XServer;

std::vector<int64_t> levelsOf(const DisplayLayout& layout) {
  std::vector<int64_t> levels;
  for (const auto& element : layout.elements) levels.push_back(element.level);
  std::sort(levels.begin(), levels.end());
  return levels;
}

TEST(WindowLayoutTest, ElementsAreTheApplicationsOfWhichTheUserSeesAnything) {
  using Levels = std::vector<int64_t>;
  constexpr ScreenArea whole{0, 0, 1920, 1080}, left{0, 0, 960, 1080}, right{960, 0, 1920, 1080},
      box{100, 100, 500, 400};
  const auto levels = [](const std::vector<ShownWindow>& windows) { return levelsOf(layoutOf(windows)); };
  EXPECT_EQ(levels({}), Levels{displaylevel::kDesktop});
  EXPECT_EQ(levels({{"film", whole, 0}, {"game", whole, 0}}), Levels{0}) << "the film is covered";
  EXPECT_EQ(levels({{"film", whole, 0}, {"game", whole, 0, false}}), (Levels{0, 0})) << "it shines through";
  EXPECT_EQ(levels({{"film", whole, 0}, {"game", left, 0}, {"chat", {950, 0, 1920, 1080}, 0}}), (Levels{0, 0}))
      << "covered by two together";
  EXPECT_EQ(levels({{"film", {0, 0, 1920, 1100}, 0}, {"game", whole, 0}}), Levels{0}) << "a rim of 20 lines is nothing";
  EXPECT_EQ(levels({{"game", left, 0}, {"film", right, 0}, {"alert", box, 2}}), (Levels{0, 0, 2}));
  EXPECT_EQ(levels({{"game", whole, 0}, {"game", box, 2}, {"game", left, 0}}), Levels{0}) << "one application";
  for (const ScreenArea& tile : {whole, left, ScreenArea{0, 600, 1920, 1080}, ScreenArea{400, 40, 1500, 1080}})
    EXPECT_TRUE(isTile(tile, whole)) << tile.left << " " << tile.top;
  for (const ScreenArea& other : {box, ScreenArea{0, 0, 1920, 60}, ScreenArea{0, 0, 80, 1080}})
    EXPECT_FALSE(isTile(other, whole)) << other.right << " " << other.bottom;
}

/// What an observer is told: the levels, one layout after the other.
class Observer final : public DisplayLayoutObserver {
 public:
  void layoutMonitorDidUpdateDisplayLayout(DisplayLayoutMonitor&, const DisplayLayout& layout) override {
    layouts_.add(levelsOf(layout));
  }
  std::vector<int64_t> next() { return layouts_.next(); }

 private:
  kit::Events<std::vector<int64_t>> layouts_;
};

/// With and without a window manager.
class DisplayLayoutTest : public kit::XServerTest, public ::testing::WithParamInterface<bool> {
 protected:
  void SetUp() override {
    XServerTest::SetUp();
    if (IsSkipped()) return;
    if (GetParam() && !kit::isInstalled("openbox")) GTEST_SKIP() << "openbox is not installed";
    client_ = std::make_unique<kit::XClient>(server_.display());
    if (GetParam()) manager_ = std::make_unique<kit::WindowManager>(server_.display());
    X11Dependencies dependencies;
    dependencies.bundleIdentifierOfProcess = [this](pid_t) -> std::optional<std::string> {
      std::lock_guard lock(lookMutex_);
      if (auto duringLook = std::exchange(duringNextLook_, nullptr)) duringLook();
      return std::nullopt;
    };
    platform_ = std::move(X11Platform::connect(server_.display(), std::move(dependencies)).value());
    monitor_ = platform_->createLayoutMonitor();
  }
  void place(const WindowProcess& process, int16_t x, uint16_t width) {
    client_->resize(process.window(), width, XServer::kHeight);
    client_->move(process.window(), x, 0);
  }
  /// The monitor takes the layout that it finds when it begins; it says when it has.
  void observe(const std::shared_ptr<Observer>& observer) {
    const size_t before = log_.countContaining("display layout: observed");
    monitor_->addObserver(observer);
    while (log_.countContaining("display layout: observed") == before) std::this_thread::yield();
  }

  /// Runs in the middle of the monitor's next look at the windows.
  void duringNextLook(std::function<void()> change) {
    std::lock_guard lock(lookMutex_);
    duringNextLook_ = std::move(change);
  }

  static constexpr uint16_t kHalf = XServer::kWidth / 2;
  fakes::LogRecorder log_;
  XServer server_;
  std::unique_ptr<kit::XClient> client_;
  std::unique_ptr<kit::WindowManager> manager_;
  std::unique_ptr<X11Platform> platform_;
  std::mutex lookMutex_;
  std::function<void()> duringNextLook_;  // guarded by lookMutex_
  std::shared_ptr<DisplayLayoutMonitor> monitor_;
};
INSTANTIATE_TEST_SUITE_P(, DisplayLayoutTest, ::testing::Bool(),
                         [](const auto& manager) { return manager.param ? "openbox" : "bare"; });

TEST_P(DisplayLayoutTest, OnlyADivisionOfTheScreenIsReported) {
  const WindowProcess game(server_.display());
  place(game, 0, XServer::kWidth);
  client_->sync();
  const auto observer = std::make_shared<Observer>();
  observe(observer);
  // Something small over it, and something under it: no report comes before that on the division.
  const WindowProcess small(server_.display());
  client_->move(small.window(), 50, 50);
  auto film = std::make_unique<WindowProcess>(server_.display());
  client_->raise(game.window());
  place(*film, kHalf, kHalf);
  client_->raise(film->window());
  place(game, 0, kHalf);
  client_->unmap(small.window());
  EXPECT_EQ(observer->next(), (std::vector<int64_t>{0, 0}));
  film->kill();
  EXPECT_EQ(observer->next(), std::vector<int64_t>{0});
  // A new time of observation begins with the layout that it finds.
  film = std::make_unique<WindowProcess>(server_.display());
  place(*film, kHalf, kHalf);
  client_->raise(film->window());
  EXPECT_EQ(observer->next(), (std::vector<int64_t>{0, 0}));
  monitor_->removeObserver(observer.get());
  observe(observer);
  film->kill();
  EXPECT_EQ(observer->next(), std::vector<int64_t>{0});
}

TEST_P(DisplayLayoutTest, AChangeDuringALookIsSeen) {
  const WindowProcess game(server_.display()), film(server_.display());
  place(game, 0, XServer::kWidth);
  client_->raise(game.window());
  const auto observer = std::make_shared<Observer>();
  observe(observer);
  duringNextLook([&] {
    place(game, 0, kHalf);
    place(film, kHalf, kHalf);
  });
  client_->raise(film.window());
  EXPECT_EQ(observer->next(), (std::vector<int64_t>{0, 0}));
}

}  // namespace
}  // namespace qv::platform
