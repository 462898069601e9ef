#include <map>
#include <mutex>

#include "platform/headless/HeadlessPlatform.h"
#include "platform/x11/X11Platform.h"
#include "tests/contracts/Backends.h"
#include "tests/kit/ApplicationReport.h"
#include "tests/kit/Events.h"
#include "tests/kit/XServer.h"

namespace qv::contracts {
namespace {

using namespace platform;

constexpr char kGame[] = "com.example.game";
constexpr char kFilm[] = "com.example.film";

/// A device on which a game and a film run.
struct ApplicationsStage {
  virtual ~ApplicationsStage() = default;
  virtual ApplicationService& applications() = 0;
  virtual pid_t processOf(const std::string& bundleID) = 0;
  virtual void bringToFront(const std::string& bundleID) = 0;
};

class HeadlessStage final : public ApplicationsStage {
  ApplicationService& applications() override { return platform_.applications(); }
  pid_t processOf(const std::string& bundleID) override { return bundleID == kGame ? 42 : 43; }
  void bringToFront(const std::string& bundleID) override {
    platform_.applications().setFrontmostApplication(bundleID);
  }
  HeadlessPlatform platform_{
      {.processOfBundleIdentifier = [this](const std::string& id) { return std::optional(processOf(id)); }}};
};

class X11Stage final : public ApplicationsStage {
  ApplicationService& applications() override { return platform_->applications(); }
  pid_t processOf(const std::string& bundleID) override { return (bundleID == kGame ? game_ : film_).pid(); }
  void bringToFront(const std::string& bundleID) override { user_.focus((bundleID == kGame ? game_ : film_).window()); }
  std::optional<std::string> bundleOf(pid_t process) const {
    if (process == game_.pid()) return kGame;
    return process == film_.pid() ? std::optional<std::string>(kFilm) : std::nullopt;
  }
  kit::XServer server_;
  kit::XClient user_{server_.display()};
  kit::WindowProcess game_{server_.display()}, film_{server_.display()};
  const std::unique_ptr<X11Platform> platform_ =
      std::move(X11Platform::connect(server_.display(),
                                     {.bundleIdentifierOfProcess = [this](pid_t process) { return bundleOf(process); }})
                    .value());
};

using Report = kit::ApplicationReport;

/// Without the state: backends tell different ones of who is behind.
Report decode(const Dictionary& dictionary) {
  Report report = Report::decode(dictionary);
  report.state = 0;
  return report;
}

class ApplicationsContract : public ContractTest<ApplicationsStage> {
 protected:
  void SetUp() override {
    ContractTest::SetUp();
    if (stage_) monitor_ = stage_->applications().createStateMonitor();
  }
  Report report(const std::string& bundleID, bool isFrontmost) {
    return {bundleID, stage_->processOf(bundleID), isFrontmost, 0};
  }
  Dictionary infoOf(const std::string& bundleID) {
    kit::Events<Dictionary> info;
    monitor_->applicationInfoForBundleIdentifier(bundleID, [&](Dictionary found) { info.add(std::move(found)); });
    return info.next();
  }
  kit::Events<Report> reports_;
  std::unique_ptr<ApplicationStateMonitor> monitor_;
};
INSTANTIATE_TEST_SUITE_P(, ApplicationsContract,
                         testing::Values(Backend<ApplicationsStage>{"headless", make<ApplicationsStage, HeadlessStage>},
                                         Backend<ApplicationsStage>{
                                             "x11", make<ApplicationsStage, X11Stage>, {"Xvfb"}}),
                         kNameOfBackend);

TEST_P(ApplicationsContract, KnowsWhoIsInFront) {
  for (const char* front : {kGame, kFilm, kGame}) {
    stage_->bringToFront(front);
    EXPECT_EQ(stage_->applications().frontmostApplication(), front);
    EXPECT_EQ(monitor_->applicationStateForBundleIdentifier(front), kApplicationForeground);
    EXPECT_EQ(decode(infoOf(front)), report(front, true));
    const char* behind = front == kGame ? kFilm : kGame;
    EXPECT_EQ(decode(infoOf(behind)), report(behind, false));
  }
  EXPECT_EQ(monitor_->applicationStateForBundleIdentifier(""), kApplicationUnknown);
  EXPECT_EQ(infoOf(""), Dictionary{});
}

TEST_P(ApplicationsContract, ReportsWhoLeftTheFrontAndWhoCame) {
  stage_->bringToFront(kGame);
  infoOf(kGame);  // what was to be reported of it is over
  monitor_->setHandler([this](const Dictionary& dictionary) { reports_.add(decode(dictionary)); });
  stage_->bringToFront(kFilm);
  EXPECT_EQ(reports_.next(), report(kGame, false));
  EXPECT_EQ(reports_.next(), report(kFilm, true));
  monitor_->setHandler({});
  stage_->bringToFront(kGame);
  infoOf(kGame);
  EXPECT_TRUE(reports_.isEmpty());
}

TEST_P(ApplicationsContract, AHandlerMayRemoveItself) {
  stage_->bringToFront(kGame);
  infoOf(kGame);
  kit::Events<bool> removed;
  monitor_->setHandler([&](const Dictionary&) {
    monitor_->setHandler({});
    removed.add(true);
  });
  stage_->bringToFront(kFilm);  // two reports; the second finds no handler
  removed.next();
  monitor_->setHandler([this](const Dictionary& dictionary) { reports_.add(decode(dictionary)); });
  stage_->bringToFront(kGame);
  reports_.nextWhere([&](const Report& last) { return last == report(kGame, true); });
  EXPECT_TRUE(removed.isEmpty());
}

}  // namespace
}  // namespace qv::contracts
