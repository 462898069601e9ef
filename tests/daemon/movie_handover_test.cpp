#include <cerrno>

#include "daemon/MovieHandover.h"
#include "support/QuorvelErrors.h"
#include "tests/fakes/FakeDevice.h"

namespace qv {
namespace {

using platform::Error;
using platform::URL;
using Names = std::vector<std::string>;
using Contents = std::vector<std::string>;

constexpr const char kChess[] = "com.example.chess";
constexpr const char kOther[] = "com.example.other";
constexpr int64_t kFull = ENOSPC;
constexpr double kDay = 86400;

class MovieHandoverTest : public testing::Test {
 protected:
  MovieHandoverTest() { device_.clock.setNow({1700000000}); }

  /// A movie of this content, as a recording of this application makes it.
  std::shared_ptr<MovieClaim> record(const std::string& content, const std::string& bundleID = kChess) {
    std::shared_ptr<MovieClaim> made;
    movies_->claimForRecording(pathInStore("Chess.mp4"), bundleID, [&](const auto& claim) { made = claim; });
    if (made) device_.disk.addFile(made->path(), content, device_.clock.now());
    return made;
  }
  URL handed(const std::string& content, const std::string& bundleID = kChess) {
    const auto claim = record(content, bundleID);
    claim->handTo(bundleID);
    return claim->url();
  }
  /// The code of the answer, 0 for no error, goes to `errors_`.
  void save(const URL& movie, const std::string& bundleID = kChess) {
    sequence_.async([this, movie, bundleID] {
      handover_->saveVideoToCameraRoll(bundleID, movie, [this](const auto& error) { note(error); });
    });
  }
  MovieHandover::KeptHandler noteKept() {
    return [this](const auto& kept, const auto& error) {
      kept_ = kept;
      note(error);
    };
  }
  void note(const std::optional<Error>& error) {
    sequence_.assertOnQueue();
    errors_.push_back(error ? error->code : 0);
  }
  std::vector<int64_t> answers() {
    device_.run();
    return std::exchange(errors_, {});
  }
  void answerLibrary() {
    device_.photoLibrary.answer();
    device_.run();
  }
  [[nodiscard]] Names store() { return device_.disk.contentsOfDirectory(fakes::kStore).value(); }
  static std::string named(const std::string& name) { return std::string(fakes::kStore) + "/" + name; }

  fakes::FakeDevice device_;
  platform::SerialQueue sequence_{"manager", device_.executor};
  const std::shared_ptr<QVTemporaryMovies> movies_ = QVTemporaryMovies::create();
  std::shared_ptr<MovieHandover> handover_ = std::make_shared<MovieHandover>(device_.platform, sequence_, movies_);
  std::vector<int64_t> errors_;
  std::optional<URL> kept_;
};

TEST_F(MovieHandoverTest, TheLibraryGetsTheMixAndTheStoreIsEmptied) {
  const URL movie = handed("game");
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
  EXPECT_EQ(device_.photoLibrary.stored[0].path(), named("QVQuorvel_Final1700000000.mp4"));
  EXPECT_EQ(device_.photoLibrary.contents, Contents{"game"});
  EXPECT_EQ(store(), Names{});
  EXPECT_TRUE(device_.log.contains("QVRecordingManager:saveVideoToCameraRoll: Video saved to camera roll successful"));
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{errorcode::kFailedToSave}) << "it is saved once";
}

TEST_F(MovieHandoverTest, WhereMixingFailsTheMovieItselfIsStored) {
  const URL movie = handed("game");
  device_.exports.result = platform::ExportStatus::Failed;
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
  EXPECT_EQ(device_.photoLibrary.stored, std::vector<URL>{movie});
  EXPECT_EQ(store(), Names{});
  EXPECT_TRUE(device_.log.contains("Error Mixing video Audio tracks"));
}

TEST_F(MovieHandoverTest, ARefusedMovieStaysAndCanBeSavedAgain) {
  const URL movie = handed("game");
  device_.photoLibrary.failure = Error::posix(kFull);
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{kFull});
  EXPECT_EQ(store(), Names{"Chess.mp4"}) << "the mix goes";
  EXPECT_TRUE(device_.log.contains("QVRecordingManager:saveVideoToCameraRoll: Video saved to camera roll failed"));
  device_.photoLibrary.failure = std::nullopt;
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
  EXPECT_EQ(device_.photoLibrary.contents, Contents{"game"});
  EXPECT_EQ(store(), Names{});
}

TEST_F(MovieHandoverTest, AnApplicationCanSaveAgainFromTheRefusalItself) {
  const URL movie = handed("game");
  device_.photoLibrary.failure = Error::posix(kFull);
  sequence_.async([&] {
    handover_->saveVideoToCameraRoll(kChess, movie, [&](const auto& error) {
      note(error);
      device_.photoLibrary.failure = std::nullopt;
      handover_->saveVideoToCameraRoll(kChess, movie, [&](const auto& second) { note(second); });
    });
  });
  EXPECT_EQ(answers(), (std::vector<int64_t>{kFull, 0}));
}

TEST_F(MovieHandoverTest, WhatIsDroppedOnTheWayCanBeSavedAgain) {
  const URL movie = handed("game");
  device_.photoLibrary.holds = true;
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{});
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{errorcode::kFailedToSave}) << "it is being saved already";
  device_.photoLibrary.drop();
  EXPECT_TRUE(movies_->isHandedTo(kChess, movie));

  save(movie);
  device_.run();
  handover_ = nullptr;
  answerLibrary();
  EXPECT_EQ(answers(), std::vector<int64_t>{}) << "nobody is there to answer";
  EXPECT_TRUE(movies_->isHandedTo(kChess, movie));
}

TEST_F(MovieHandoverTest, OnlyWhatWasHandedToTheCallerAndIsThereIsSaved) {
  const URL movie = handed("game");
  save(movie, kOther);
  save(URL::fileURL("/etc/passwd"));
  ASSERT_FALSE(device_.disk.removeItem(movie.path()));
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>(3, errorcode::kFailedToSave));
  EXPECT_EQ(device_.photoLibrary.stored, std::vector<URL>{});
  EXPECT_EQ(device_.log.count("a movie that was not handed to the caller is not saved"), 3u);
}

TEST_F(MovieHandoverTest, TwoApplicationsOfOneNameSaveWithinASecond) {
  const URL first = handed("game of one");
  const URL second = handed("game of the other", kOther);
  EXPECT_NE(first, second);
  device_.exports.holds = true;
  save(first);
  save(second, kOther);
  device_.run();
  ASSERT_EQ(device_.exports.sessions.size(), 2u);
  EXPECT_NE(device_.exports.sessions[0]->output, device_.exports.sessions[1]->output);
  for (const auto& session : device_.exports.sessions) session->end();
  EXPECT_EQ(answers(), (std::vector<int64_t>{0, 0}));
  EXPECT_EQ(device_.photoLibrary.contents, (Contents{"game of one", "game of the other"}));
  EXPECT_EQ(store(), Names{});
}

TEST_F(MovieHandoverTest, TheNextRecordingWaitsAndTheOldMovieIsWhatIsSaved) {
  device_.exports.result = platform::ExportStatus::Failed;  // the library copies the movie itself
  device_.photoLibrary.holds = true;
  const URL movie = handed("old");
  save(movie);
  device_.run();
  std::shared_ptr<MovieClaim> next;
  movies_->claimForRecording(movie.path(), kChess, [&](const auto& claim) {
    next = claim;
    EXPECT_FALSE(claim->hasFile());
    device_.disk.addFile(claim->path(), "new", device_.clock.now());
  });
  device_.run();
  EXPECT_FALSE(next);
  answerLibrary();
  ASSERT_TRUE(next);
  EXPECT_EQ(next->url(), movie);
  EXPECT_EQ(device_.photoLibrary.contents, Contents{"old"});
  EXPECT_EQ(device_.disk.readFile(movie.path()).value(), "new");
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
}

TEST_F(MovieHandoverTest, ASystemRecordingThatAnotherStartEndsIsStoredUnmixed) {
  const auto claim = record("screen");
  sequence_.async([&] { handover_->storeSystemRecording(claim, kChess, noteKept()); });
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
  EXPECT_EQ(kept_, std::nullopt);
  EXPECT_TRUE(device_.exports.sessions.empty());
  EXPECT_EQ(device_.photoLibrary.contents, Contents{"screen"});
  EXPECT_EQ(store(), Names{});
  EXPECT_TRUE(
      device_.log.contains("QVRecordingManager:stopCurrentRecordingSession: Video saved to camera roll successful"));

  sequence_.async([&] { handover_->storeSystemRecording(nullptr, kChess, noteKept()); });
  EXPECT_EQ(answers(), std::vector<int64_t>{errorcode::kFailedToSave}) << "no success without a movie";
  EXPECT_TRUE(
      device_.log.contains("QVRecordingManager:stopCurrentRecordingSession: Video saved to camera roll failed"));
}

TEST_F(MovieHandoverTest, ARefusedSystemRecordingIsLeftToItsApplication) {
  device_.photoLibrary.failure = Error::posix(kFull);
  const auto stopped = record("screen");
  sequence_.async([&] { handover_->storeSystemRecording(stopped, kChess, noteKept()); });
  EXPECT_EQ(answers(), std::vector<int64_t>{kFull});
  EXPECT_EQ(kept_, stopped->url());
  EXPECT_TRUE(movies_->isHandedTo(kChess, stopped->url()));

  const auto interrupted = record("asleep", kOther);
  sequence_.async([&] { handover_->saveInterrupted(interrupted, kOther, noteKept()); });
  EXPECT_EQ(answers(), std::vector<int64_t>{kFull});
  EXPECT_EQ(kept_, interrupted->url());
  EXPECT_TRUE(device_.log.contains("error saving file with code: " + std::to_string(kFull)));

  device_.photoLibrary.failure = std::nullopt;
  save(*kept_, kOther);
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
  EXPECT_EQ(device_.exports.sessions.size(), 2u) << "with its sound mixed, both times";
  EXPECT_EQ(device_.photoLibrary.contents, Contents{"asleep"});
}

TEST_F(MovieHandoverTest, DiscardRemovesOnlyWhatItsCallerWasHandedLast) {
  const URL mine = handed("mine");
  const URL others = handed("others", kOther);
  int answered = 0;
  const auto discard = [&] {
    sequence_.async([&] {
      handover_->discard(kChess, [&] {
        sequence_.assertOnQueue();
        ++answered;
      });
    });
    device_.run();
  };
  discard();
  discard();
  EXPECT_EQ(answered, 2);
  EXPECT_FALSE(device_.disk.itemExists(mine.path()));
  EXPECT_TRUE(movies_->isHandedTo(kOther, others));

  const URL stuck = handed("stuck");
  device_.disk.failOn(fakes::FakeFileSystem::Operation::Remove, stuck.path(), EBUSY);
  discard();
  EXPECT_EQ(answered, 3);
  EXPECT_TRUE(device_.log.contains("error removing file with code: " + std::to_string(EBUSY)));
}

TEST_F(MovieHandoverTest, AMixThatCannotBeRemovedIsTheAnswer) {
  const URL movie = handed("game");
  const std::string mix = named("QVQuorvel_Final1700000000.mp4");
  device_.disk.failOn(fakes::FakeFileSystem::Operation::Remove, mix, EBUSY);
  save(movie);
  EXPECT_EQ(answers(), std::vector<int64_t>{EBUSY});
  EXPECT_TRUE(device_.log.contains("error removing file with code: " + std::to_string(EBUSY)));
  EXPECT_EQ(store(), Names{"QVQuorvel_Final1700000000.mp4"}) << "it ages out";
}

TEST_F(MovieHandoverTest, ARecordingThatIsPausedForTwoDaysCanStillBeSaved) {
  const auto paused = record("game");
  device_.clock.setNow({1700000000 + 2 * kDay});
  EXPECT_EQ(movies_->deleteFilesOlderThanTimeToLiveInSeconds(kDay), 0);
  paused->handTo(kChess);
  save(paused->url());
  device_.exports.holds = true;
  device_.run();
  EXPECT_EQ(movies_->deleteFilesOlderThanTimeToLiveInSeconds(kDay), 0) << "it is being saved";
  device_.exports.sessions.back()->end();
  EXPECT_EQ(answers(), std::vector<int64_t>{0});
  EXPECT_EQ(device_.photoLibrary.contents, Contents{"game"});
}

}  // namespace
}  // namespace qv
