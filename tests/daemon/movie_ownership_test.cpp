#include "tests/daemon/DaemonTest.h"

namespace qv {
namespace {

using platform::Value;

/// Whose a movie is, from one feature to the next.
class MovieOwnershipTest : public DaemonTest {
 protected:
  void endExports() {
    for (const auto& session : device_.exports.sessions) session->end();
    device_.run();
  }
  std::vector<std::string> storeFiles() { return device_.disk.contentsOfDirectory(fakes::kStore).value(); }

  void SetUp() override { suppressAlert(); }
};

TEST_F(MovieOwnershipTest, AStartDuringASaveLosesNothingToIt) {
  auto client = game();
  const std::string movie = recordMovie(client);
  device_.exports.holds = true;
  const auto saved = client.post("saveVideoToCameraRoll", {Value(movie)});
  const auto started = client.postStart({});
  device_.run();
  sendFrame(2 * kSecond);  // of a recording that did not wait
  endExports();
  ASSERT_TRUE(*saved && *started);
  EXPECT_EQ((*saved)->code(), 0);
  EXPECT_EQ(device_.exports.sessions.at(0)->content, "movie 0");
  EXPECT_EQ((*started)->code(), 0);
  sendFrame(3 * kSecond);
  EXPECT_EQ(contentAt(stop(client)), "movie 1");
}

TEST_F(MovieOwnershipTest, AStartReplacesTheOwnFormerMovieAndTheRightToIt) {
  auto client = game();
  const std::string former = recordMovie(client);
  record(client);
  EXPECT_EQ(save(client, former), errorcode::kFailedToSave);
  EXPECT_TRUE(device_.photoLibrary.stored.empty());
  EXPECT_EQ(contentAt(stop(client)), "movie 1");
}

TEST_F(MovieOwnershipTest, ApplicationsOfOneNameLeaveEachOthersMoviesAlone) {
  auto first = game();
  auto second = namesake();
  const std::string movie = recordMovie(first);
  const std::string other = recordMovie(second);
  EXPECT_TRUE(platform::URL(other).path().ends_with("/Game 2.mp4")) << other;
  EXPECT_EQ(contentAt(movie), "movie 0");
  EXPECT_EQ(contentAt(other), "movie 1");
  EXPECT_EQ(save(second, movie), errorcode::kFailedToSave);
  device_.disk.addFile("/etc/passwd", "root");
  EXPECT_EQ(save(second, "file:///etc/passwd"), errorcode::kFailedToSave);
  second.request("discardRecordingWithHandler");
  EXPECT_EQ(contentAt(other), "");
  // The takeover removes what the second records, and nothing else.
  record(second);
  auto third = chat();
  record(third);
  EXPECT_EQ(second.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(second.lastMovie(), "");
  EXPECT_EQ(contentAt(movie), "movie 0");
  EXPECT_EQ(save(first, movie), 0);
}

TEST_F(MovieOwnershipTest, ADiscardTakesOnlyWhatItsCallerWasHandedLast) {
  auto first = game();
  auto second = namesake();
  const std::string movie = recordMovie(first);
  second.request("discardRecordingWithHandler");
  EXPECT_EQ(contentAt(movie), "movie 0");
  EXPECT_EQ(save(first, movie), 0);
  const std::string others = recordMovie(second);
  first.request("discardRecordingWithHandler");  // its movie is in the library
  EXPECT_EQ(contentAt(others), "movie 1");
}

TEST_F(MovieOwnershipTest, ATrimmedStopLeavesOneMovieAndADiscardNone) {
  auto client = game();
  record(client);
  const std::vector<Value> clips{Value(1.0), Value(1.0)};
  const auto answer = client.request("stopRecordingWithStartClipDuration", clips);
  EXPECT_TRUE(answer->values[0].asString().ends_with("/Game_trimmed.mp4"));
  EXPECT_EQ(storeFiles(), std::vector<std::string>{"Game_trimmed.mp4"});
  client.request("discardRecordingWithHandler");
  EXPECT_EQ(storeFiles(), std::vector<std::string>{});
  // A discard that comes while the recording ends waits for what there is then.
  record(client);
  client.post("stopRecordingWithHandler");
  const auto discarded = client.post("discardRecordingWithHandler");
  device_.run();
  ASSERT_TRUE(*discarded);
  EXPECT_EQ((*discarded)->failureName(), "");
  EXPECT_EQ(storeFiles(), std::vector<std::string>{});
  for (const auto& [start, end] : {std::pair(0.0, 3.0), std::pair(3.0, 0.0)}) {
    record(client);
    const auto whole = client.request("stopRecordingWithStartClipDuration", {Value(start), Value(end)});
    EXPECT_TRUE(whole->values[0].asString().ends_with("/Game.mp4")) << start;
  }
  // What cannot be trimmed is handed over whole.
  device_.exports.result = platform::ExportStatus::Failed;
  record(client);
  EXPECT_EQ(client.request("stopRecordingWithStartClipDuration", clips)->code(1), 0);
  EXPECT_EQ(storeFiles(), std::vector<std::string>{"Game.mp4"});
}

TEST_F(MovieOwnershipTest, AMovieWhoseFileHasGoneIsNotAnswered) {
  auto client = game();
  record(client);
  device_.disk.removeItem(device_.movies.last().url.path());
  const auto answer = client.stop();
  EXPECT_EQ(answer->code(1), errorcode::kFailedToSave);
  EXPECT_EQ(answer->values[0].asString(), "");
}

TEST_F(MovieOwnershipTest, ACaptureLeavesTheUnsavedMovieAlone) {
  auto client = game();
  const std::string movie = recordMovie(client);
  record(client, {.capture = true});
  EXPECT_EQ(client.stop()->code(1), 0);
  EXPECT_EQ(contentAt(movie), "movie 0");
  EXPECT_EQ(save(client, movie), 0);
}

TEST_F(MovieOwnershipTest, TwoSavesAtOnceMixIntoFilesOfTheirOwnWhichNoPurgeTakes) {
  auto first = game();
  auto second = chat();
  const std::vector<std::string> movies{recordMovie(first), recordMovie(second)};
  device_.exports.holds = true;
  const auto firstSave = first.post("saveVideoToCameraRoll", {Value(movies[0])});
  const auto secondSave = second.post("saveVideoToCameraRoll", {Value(movies[1])});
  device_.run();
  for (const auto& session : device_.exports.sessions) EXPECT_EQ(session->mix.size(), 2u) << "each track its own";
  EXPECT_EQ(device_.purgeableSpace.callbacks.purge(1, 3), 0);
  endExports();
  ASSERT_TRUE(*firstSave && *secondSave);
  EXPECT_EQ((*firstSave)->code(), 0);
  EXPECT_EQ((*secondSave)->code(), 0);
  EXPECT_EQ(device_.photoLibrary.contents, (std::vector<std::string>{"movie 0", "movie 1"}));
  EXPECT_EQ(storeFiles(), std::vector<std::string>{});
}

TEST_F(MovieOwnershipTest, ALibraryThatRefusesLeavesTheMovieToBeSavedAgain) {
  auto client = game();
  const std::string movie = recordMovie(client);
  device_.photoLibrary.failure = platform::Error::posix(ENOSPC);
  EXPECT_EQ(save(client, movie), ENOSPC);
  EXPECT_EQ(storeFiles(), std::vector<std::string>{"Game.mp4"});

  auto system = systemUI();
  record(system, {.system = true});
  record(client);
  EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted});
  EXPECT_EQ(contentAt(system.lastMovie()), "movie 1");
  device_.photoLibrary.failure.reset();
  EXPECT_EQ(save(system, system.lastMovie()), 0);
  EXPECT_EQ(save(client, stop(client)), 0);
  EXPECT_EQ(storeFiles(), std::vector<std::string>{});
}

TEST_F(MovieOwnershipTest, ASystemRecordingWhoseFileGoesAtItsEndKeepsNobodyWaiting) {
  auto system = systemUI();
  auto client = game();
  for (const bool sleeps : {false, true}) {
    for (int pieces = 0; pieces < kPieces; ++pieces) {
      record(system, {.system = true});
      const std::string file = device_.movies.last().url.path();
      const auto started = sleeps ? nullptr : client.postStart({});
      if (sleeps) manager_->stopSystemRecordingWithInterruption();
      runWork(pieces);
      device_.disk.removeItem(file);
      device_.run();
      EXPECT_EQ(system.takeEnds(), std::vector<int64_t>{errorcode::kInterrupted}) << pieces;
      EXPECT_TRUE(sleeps || (*started && (*started)->code() == 0)) << pieces;
      client.stop();
      EXPECT_EQ(openTransactions(), 0);
    }
  }
}

TEST_F(MovieOwnershipTest, WhereMixingFailsTheMovieItselfIsStored) {
  auto client = game();
  const std::string movie = recordMovie(client);
  device_.exports.result = platform::ExportStatus::Failed;
  EXPECT_EQ(save(client, movie), 0);
  EXPECT_EQ(device_.photoLibrary.contents, std::vector<std::string>{"movie 0"});
  EXPECT_EQ(storeFiles(), std::vector<std::string>{});
}

TEST_F(MovieOwnershipTest, ASaveThatTheLibraryForgetsCanBeTriedAgain) {
  auto client = game();
  const std::string movie = recordMovie(client);
  device_.photoLibrary.holds = true;
  const auto forgotten = client.post("saveVideoToCameraRoll", {Value(movie)});
  device_.run();
  EXPECT_EQ(save(client, movie), errorcode::kFailedToSave) << "it is being saved already";
  device_.photoLibrary.drop();
  device_.run();
  device_.photoLibrary.holds = false;
  EXPECT_EQ(save(client, movie), 0);
}

TEST_F(MovieOwnershipTest, AFileThatCannotBeRemovedIsToldAndKeepsNobodyWaiting) {
  using Operation = fakes::ScratchDisk::Operation;
  auto client = game();
  const std::string movie = recordMovie(client);
  device_.clock.setNow({1700000000});
  const std::string mix = "QVQuorvel_Final1700000000.mp4";
  device_.disk.failOn(Operation::Remove, std::string(fakes::kStore) + "/" + mix, EBUSY);
  EXPECT_EQ(save(client, movie), EBUSY);
  EXPECT_EQ(storeFiles(), std::vector<std::string>{mix}) << "it ages out";
  const std::string discarded = recordMovie(client);
  device_.disk.failOn(Operation::Remove, platform::URL(discarded).path(), EBUSY);
  EXPECT_FALSE(client.request("discardRecordingWithHandler")->failure);
  EXPECT_EQ(save(client, discarded), errorcode::kFailedToSave) << "it is nobody's";
  EXPECT_EQ(device_.log.count("error removing file with code: " + std::to_string(EBUSY)), 2u);
}

TEST_F(MovieOwnershipTest, ADailyPurgeLeavesWhatIsBeingRecorded) {
  auto client = game();
  record(client);
  client.request("pauseRecording");
  device_.clock.advance(std::chrono::hours(48));
  device_.disk.addFile(std::string(fakes::kStore) + "/young.mp4", "x", device_.clock.now());
  device_.disk.addFile(std::string(fakes::kStore) + "/old.mp4", "x");
  device_.purgeableSpace.callbacks.periodic(1, 1);
  device_.run();
  EXPECT_EQ(contentAt(stop(client)), "movie 0");
  EXPECT_FALSE(device_.disk.itemExists(std::string(fakes::kStore) + "/old.mp4"));
}

TEST_F(MovieOwnershipTest, ANearlyFullDiskHandsOverTheMovieThatItEnds) {
  auto client = game();
  const auto& callbacks = device_.purgeableSpace.callbacks;
  device_.disk.addFile(std::string(fakes::kStore) + "/old.mp4", "12345");
  EXPECT_EQ(callbacks.purgeable(1), device_.files._srSizeOfTempDir(nullptr));
  EXPECT_EQ(callbacks.purge(1, 2), 0) << "nothing is recorded";
  record(client);
  EXPECT_EQ(callbacks.purge(1, 2), 0);
  device_.disk.setFreeSize(49'999'999);
  EXPECT_EQ(callbacks.purge(1, 1), 0);
  EXPECT_TRUE(client.isRecording());
  EXPECT_EQ(callbacks.purge(1, 2), 5);
  device_.run();
  EXPECT_EQ(client.takeEnds(), std::vector<int64_t>{errorcode::kInsufficientStorage});
  EXPECT_EQ(contentAt(client.lastMovie()), "movie 0");
  EXPECT_EQ(save(client, client.lastMovie()), 0);
  device_.disk.setFreeSize(1'000'000'000);
  record(client, {.capture = true});
  device_.disk.setFreeSize(49'999'999);
  callbacks.purge(1, 2);
  EXPECT_TRUE(client.isRecording()) << "a capture fills no disk";
}

class InterruptionTest : public MovieOwnershipTest {
 protected:
  void SetUp() override {}
};

TEST_F(InterruptionTest, AnInterruptedMovieIsNeverToldByTheNameOfTheNextOne) {
  auto asked = game();
  auto client = chat();
  asked.start();
  client.start();
  device_.alerts.shown.at(1)->handler(platform::UserAlertAnswer::Default);
  device_.run();
  sendFrame(kSecond);
  device_.alerts.shown.at(0)->handler(platform::UserAlertAnswer::Default);
  device_.run();
  const auto told = client.takeEnd();
  ASSERT_TRUE(told);
  EXPECT_EQ(told->code, errorcode::kInterrupted);
  EXPECT_EQ(contentAt(told->movie), "movie 0");
  record(client);
  client.request("clientDidBecomeActive");
  const auto again = client.takeEnd();
  ASSERT_TRUE(again);
  EXPECT_EQ(again->code, errorcode::kInterrupted);
  EXPECT_NE(contentAt(again->movie), device_.movies.last().content);
  client.request("clientDidBecomeActive");
  EXPECT_TRUE(client.takeEnds().empty()) << "it has been told";
  EXPECT_TRUE(client.isRecording());
}

}  // namespace
}  // namespace qv
