#include "support/QVTemporaryMovies.h"

#include <cerrno>
#include <mutex>
#include <set>
#include <thread>
#include <vector>

#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using fakes::FakeClock;
using platform::URL;
using Operation = fakes::ScratchDisk::Operation;
using Claim = std::shared_ptr<MovieClaim>;
using Names = std::vector<std::string>;

constexpr const char kChess[] = "com.example.chess";
constexpr const char kOther[] = "com.example.other";
constexpr double kDay = 86400;

class TemporaryMoviesTest : public SupportTest {
 protected:
  TemporaryMoviesTest() { disk_.addDirectory(files_._srTempPath()); }

  void addFile(const std::string& name, double age = 0) {
    disk_.addFile(files_.pathInStore(name), "movie", {FakeClock::kStart - age});
  }
  [[nodiscard]] bool exists(const std::string& name) { return disk_.itemExists(files_.pathInStore(name)); }
  [[nodiscard]] URL url(const std::string& name) const { return URL::fileURL(files_.pathInStore(name)); }
  [[nodiscard]] std::string nameOf(const Claim& claim) const {
    return claim ? claim->path().substr(files_._srTempPath().size()) : "no claim";
  }
  /// The claim, where there was nothing to wait for.
  Claim record(const std::string& name, const std::string& bundleID = kChess) {
    auto claim = std::make_shared<Claim>();
    movies_->claimForRecording(files_.pathInStore(name), bundleID, [claim](const Claim& to) { *claim = to; });
    return *claim;
  }
  /// A movie that was made and handed.
  void hand(const std::string& name, const std::string& bundleID = kChess, double age = 0) {
    const Claim claim = record(name, bundleID);
    ASSERT_TRUE(claim);
    disk_.addFile(claim->path(), "movie", {FakeClock::kStart - age});
    claim->handTo(bundleID);
  }
  /// Starts to wait for a claim; what it gets, it keeps in `waited_`.
  void wait(const std::string& name, const std::string& bundleID = kChess) {
    movies_->claimForRecording(files_.pathInStore(name), bundleID,
                               [this](const Claim& claim) { waited_.push_back(claim); });
  }
  [[nodiscard]] Names waitedNames() const {
    Names names;
    for (const Claim& claim : waited_) names.push_back(nameOf(claim));
    return names;
  }
  FileCompletion recordError() {
    return [this](const auto& error) { errors_.push_back(error ? error->code : 0); };
  }

  std::shared_ptr<QVTemporaryMovies> movies_ = QVTemporaryMovies::create(files_);
  std::vector<Claim> waited_;
  std::vector<int64_t> errors_;
};

TEST_F(TemporaryMoviesTest, NobodyRecordsOverTheMovieOfAnotherOrOverOneThatIsBeingMade) {
  addFile("Chess.mp4");
  const Claim leftover = record("Chess.mp4");
  EXPECT_EQ(nameOf(leftover), "Chess.mp4") << "what is nobody's is replaced";
  const Claim second = record("/Chess.mp4", kOther);
  EXPECT_EQ(nameOf(second), "Chess 2.mp4") << "a doubled separator is one";
  EXPECT_EQ(nameOf(record("Chess.mp4", kOther)), "Chess 3.mp4");
  leftover->handTo(kChess);
  EXPECT_EQ(nameOf(record("Chess.mp4", kOther)), "Chess 3.mp4") << "the third was given up";
  EXPECT_EQ(nameOf(record("Chess.mp4")), "Chess.mp4");
  EXPECT_FALSE(movies_->isHandedTo(kChess, url("Chess.mp4"))) << "the next recording replaces it";
}

TEST_F(TemporaryMoviesTest, CopiesLeaveAloneWhatIsNotTheirs) {
  addFile("mix.mp4");
  const Claim mix = movies_->claimNew(files_.pathInStore("mix.mp4"));
  EXPECT_EQ(nameOf(mix), "mix 2.mp4");
  EXPECT_EQ(nameOf(movies_->claimNew(files_.pathInStore("mix 2.mp4"))), "mix 2 2.mp4");

  addFile("Chess_trimmed.mp4");
  movies_->claimTrimmed(files_.pathInStore("Chess_trimmed.mp4"), kChess)->handTo(kChess);
  EXPECT_EQ(nameOf(movies_->claimTrimmed(files_.pathInStore("Chess_trimmed.mp4"), kOther)), "Chess_trimmed 2.mp4");
  const auto save = movies_->beginSave(kChess, url("Chess_trimmed.mp4"));
  ASSERT_TRUE(save);
  EXPECT_EQ(nameOf(movies_->claimTrimmed(files_.pathInStore("Chess_trimmed.mp4"), kChess)), "Chess_trimmed 2.mp4");
  save->succeeded(nullptr);
  background_.runUntilIdle();
  EXPECT_EQ(nameOf(movies_->claimTrimmed(files_.pathInStore("Chess_trimmed.mp4"), kChess)), "Chess_trimmed.mp4");

  addFile("stuck.mp4");
  disk_.failOn(Operation::Remove, files_.pathInStore("stuck.mp4"), EBUSY);
  movies_->deleteAllTempFiles();
  EXPECT_EQ(nameOf(movies_->claimTrimmed(files_.pathInStore("stuck.mp4"), kChess)), "stuck.mp4") << "it is nobody's";
}

TEST_F(TemporaryMoviesTest, OnlyItsApplicationSavesAMovieAndOnlyOnceAtATime) {
  hand("Chess.mp4");
  EXPECT_FALSE(movies_->beginSave(kOther, url("Chess.mp4")));
  EXPECT_FALSE(movies_->beginSave(kChess, URL("https://example.com/Chess.mp4")));
  auto save = movies_->beginSave(kChess, url("/./Chess.mp4"));
  ASSERT_TRUE(save);
  EXPECT_EQ(save->movie(), url("Chess.mp4"));
  EXPECT_FALSE(movies_->beginSave(kChess, url("Chess.mp4")));
  save = nullptr;
  save = movies_->beginSave(kChess, url("Chess.mp4"));
  ASSERT_TRUE(save) << "a save that came to nothing can be tried again";
  save->succeeded(recordError());
  save->succeeded(recordError());
  save->succeeded(nullptr);
  background_.runUntilIdle();
  EXPECT_EQ(errors_, (std::vector<int64_t>{0, ENOENT})) << "the right is used up";
  EXPECT_FALSE(exists("Chess.mp4"));

  hand("Chess.mp4");
  ASSERT_FALSE(disk_.removeItem(files_.pathInStore("Chess.mp4")));
  EXPECT_FALSE(movies_->isHandedTo(kChess, url("Chess.mp4")));
  EXPECT_FALSE(movies_->beginSave(kChess, url("Chess.mp4"))) << "it was removed behind our back";
  disk_.addFile(files_.pathInStore("Chess.mp4"), "");
  EXPECT_FALSE(movies_->beginSave(kChess, url("Chess.mp4"))) << "an empty file is no movie";
}

TEST_F(TemporaryMoviesTest, ARecordingWaitsUntilItsFormerMovieIsSavedAndGone) {
  hand("Chess.mp4");
  auto save = movies_->beginSave(kChess, url("Chess.mp4"));
  wait("Chess.mp4");
  wait("Chess.mp4");
  EXPECT_EQ(nameOf(record("Chess.mp4", kOther)), "Chess 2.mp4") << "another application does not wait";
  save->succeeded([this](const auto&) {
    EXPECT_EQ(waited_.size(), 2u);
    wait("Chess.mp4");  // from a completion
  });
  EXPECT_EQ(waitedNames(), Names{}) << "the file is still there";
  background_.runUntilIdle();
  EXPECT_EQ(waitedNames(), (Names{"Chess.mp4", "Chess 2.mp4", "Chess 3.mp4"}));
  EXPECT_FALSE(exists("Chess.mp4"));
}

TEST_F(TemporaryMoviesTest, ARecordingWaitsForASaveThatFailsAndForARemoval) {
  hand("Chess.mp4");
  auto save = movies_->beginSave(kChess, url("Chess.mp4"));
  wait("Chess.mp4");
  save = nullptr;
  EXPECT_EQ(waitedNames(), Names{"Chess 2.mp4"});
  EXPECT_TRUE(movies_->isHandedTo(kChess, url("Chess.mp4"))) << "it was wanted a moment ago";
  waited_[0]->remove(recordError());
  waited_[0]->remove(recordError());
  waited_[0]->handTo(kChess);
  movies_->discardLast(kChess, recordError());
  wait("Chess.mp4");
  EXPECT_EQ(waited_.size(), 1u);
  background_.runUntilIdle();
  EXPECT_EQ(errors_, (std::vector<int64_t>{0, ENOENT, 0})) << "a claim ends once";
  EXPECT_EQ(waitedNames(), (Names{"Chess 2.mp4", "Chess.mp4"}));
  record("Draft.mp4")->remove(nullptr);
  wait("Draft.mp4");
  EXPECT_EQ(waited_.size(), 2u) << "it is being removed by whoever made it";
  background_.runUntilIdle();
  EXPECT_EQ(nameOf(waited_.back()), "Draft.mp4");
}

TEST_F(TemporaryMoviesTest, AMovieThatIsStoredFirstIsHandedWhereThatFails) {
  const Claim claim = record("Screen.mp4");
  EXPECT_FALSE(claim->saveFor(kChess)) << "there is no file";
  addFile("Screen.mp4");
  auto save = claim->saveFor(kChess);
  ASSERT_TRUE(save) << "the claim went on";
  EXPECT_FALSE(claim->saveFor(kChess));
  claim->handTo(kOther);
  EXPECT_EQ(movies_->deleteAllTempFiles(), 0);
  wait("Screen.mp4");
  EXPECT_EQ(waitedNames(), Names{});
  save = nullptr;
  EXPECT_EQ(waitedNames(), Names{"Screen 2.mp4"});
  EXPECT_TRUE(movies_->isHandedTo(kChess, url("Screen.mp4")));
  movies_->discardLast(kChess, nullptr);
  movies_->discardLast(kChess, nullptr);
  background_.runUntilIdle();
  EXPECT_FALSE(exists("Screen.mp4"));
}

TEST_F(TemporaryMoviesTest, WhoeverWaitsIsDroppedWithTheStore) {
  hand("Chess.mp4");
  auto save = movies_->beginSave(kChess, url("Chess.mp4"));
  const auto held = std::make_shared<int>();
  movies_->claimForRecording(files_.pathInStore("Chess.mp4"), kChess,
                             [held](const Claim&) { FAIL() << "its store is gone"; });
  movies_ = nullptr;
  EXPECT_EQ(held.use_count(), 1);
  save = nullptr;
}

TEST_F(TemporaryMoviesTest, DiscardTakesTheLastHandedMovieOfItsCallerAlone) {
  hand("Chess.mp4");
  hand("Chess_trimmed.mp4");
  hand("Other.mp4", kOther);
  auto save = movies_->beginSave(kChess, url("Chess_trimmed.mp4"));
  movies_->discardLast(kChess, recordError());
  background_.runUntilIdle();
  EXPECT_TRUE(exists("Chess_trimmed.mp4")) << "it is being saved";
  EXPECT_TRUE(errors_.empty()) << "whether it goes is not known yet";
  save = nullptr;
  movies_->discardLast(kChess, recordError());
  movies_->discardLast(kChess, recordError());
  background_.runUntilIdle();
  EXPECT_FALSE(exists("Chess_trimmed.mp4"));
  EXPECT_TRUE(exists("Chess.mp4")) << "an earlier movie is not the last one";
  EXPECT_TRUE(movies_->isHandedTo(kOther, url("Other.mp4")));
  EXPECT_EQ(errors_, (std::vector<int64_t>{0, 0, 0}));

  // Nor is one that another application has at its path by now, or that is being made there anew.
  movies_->deleteAllTempFiles();
  hand("Chess_trimmed.mp4");
  movies_->deleteAllTempFiles();
  hand("Chess_trimmed.mp4", kOther);
  movies_->discardLast(kChess, nullptr);
  background_.runUntilIdle();
  EXPECT_TRUE(movies_->isHandedTo(kOther, url("Chess_trimmed.mp4")));
  hand("Chess.mp4");
  const Claim made = record("Chess.mp4");
  movies_->discardLast(kChess, nullptr);
  background_.runUntilIdle();
  EXPECT_TRUE(made->hasFile());
}

TEST_F(TemporaryMoviesTest, PurgesLeaveAloneWhatIsMadeOrSaved) {
  const Claim paused = record("Paused.mp4");
  addFile("Paused.mp4", 2 * kDay);
  hand("Saved.mp4", kChess, 2 * kDay);
  hand("Handed.mp4", kChess, 2 * kDay);
  hand("Fresh.mp4", kChess);
  hand("Stuck.mp4", kChess, 2 * kDay);
  addFile("leftover.mp4", 2 * kDay);
  disk_.failOn(Operation::Remove, files_.pathInStore("Stuck.mp4"), EBUSY);
  auto save = movies_->beginSave(kChess, url("Saved.mp4"));
  EXPECT_EQ(movies_->deleteFilesOlderThanTimeToLiveInSeconds(kDay), 2 * 5);
  EXPECT_TRUE(paused->hasFile() && exists("Saved.mp4"));
  EXPECT_TRUE(movies_->isHandedTo(kChess, url("Fresh.mp4")));
  EXPECT_TRUE(movies_->isHandedTo(kChess, url("Stuck.mp4"))) << "it is still there";
  EXPECT_EQ(nameOf(record("Handed.mp4", kOther)), "Handed.mp4") << "what aged out is forgotten";

  disk_.failOn(Operation::Remove, files_.pathInStore("Stuck.mp4"), 0);
  EXPECT_EQ(movies_->deleteAllTempFiles(), 2 * 5);
  EXPECT_TRUE(paused->hasFile() && exists("Saved.mp4"));
  save = nullptr;
  paused->handTo(kChess);
  EXPECT_EQ(movies_->deleteAllTempFiles(), 2 * 5);
}

TEST_F(TemporaryMoviesTest, ManyThreadsNeverShareAPath) {
  std::mutex mutex;
  std::set<std::string> taken;
  const auto work = [&](int thread) {
    const std::string bundleID = thread % 2 == 0 ? kChess : kOther;
    for (int i = 0; i < 200; ++i) {
      // Another thread may run it, after this one's end.
      movies_->claimForRecording(files_.pathInStore("Chess.mp4"), bundleID, [&, bundleID](const Claim& claim) {
        {
          std::lock_guard lock(mutex);
          EXPECT_TRUE(taken.insert(claim->path()).second) << claim->path();
        }
        disk_.addFile(claim->path(), "movie");
        EXPECT_TRUE(claim->hasFile());
        std::lock_guard lock(mutex);
        taken.erase(claim->path());
        claim->handTo(bundleID);
      });
      (void)movies_->beginSave(bundleID, url("Chess.mp4"));
      movies_->deleteAllTempFiles();
    }
  };
  std::vector<std::thread> threads;
  for (int thread = 0; thread < 4; ++thread) threads.emplace_back(work, thread);
  for (std::thread& thread : threads) thread.join();
  EXPECT_TRUE(taken.empty());
}

}  // namespace
}  // namespace qv
