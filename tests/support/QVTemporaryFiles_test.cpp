#include "support/QVTemporaryFiles.h"

#include <cerrno>
#include <cmath>
#include <vector>

#include "support/QVDiskSpace.h"
#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using fakes::FakeClock;
using fakes::ScratchDisk;
using platform::Error;
using platform::URL;
using Operation = ScratchDisk::Operation;

constexpr const char kStore[] = "/root/private/var/mobile/Library/Quorvel";
class TemporaryFilesTest : public SupportTest {
 protected:
  void addFile(const std::string& name, uint64_t size, double age = 0) {
    disk_.addFile(path(name), std::string(size, 'x'), {FakeClock::kStart - age});
  }
  static std::string path(const std::string& name) { return std::string(kStore) + "/" + name; }
  bool exists(const std::string& name) { return disk_.itemExists(path(name)); }
};

TEST_F(TemporaryFilesTest, SetupMakesTheDirectoryOnceAndSurvivesFailure) {
  disk_.addDirectory("/root/private/var/mobile/Library");
  files_._srSetupTempDirectory();
  EXPECT_TRUE(disk_.itemExists(kStore));
  addFile("kept.mp4", 1);
  files_._srSetupTempDirectory();
  EXPECT_TRUE(exists("kept.mp4"));

  disk_.addFile("/other/private/var/mobile/Library/Quorvel", "a plain file in the way");
  platform_.deviceRoot = "/other";
  files_._srSetupTempDirectory();
  EXPECT_FALSE(log_.contains("error creating temp directory"));
  platform_.deviceRoot = "/without/parents";
  files_._srSetupTempDirectory();
  EXPECT_TRUE(log_.contains("error creating temp directory"));
  EXPECT_EQ(log_.countContaining("error: "), 1u) << "and why, on the console";
}

TEST_F(TemporaryFilesTest, OnlyWhatIsKnownToBeOlderAgesOut) {
  addFile("old.mp4", 100, 86400.5);
  addFile("limit.mp4", 10, 86400.0);
  addFile("new.mp4", 1, 5);
  addFile("unknown.mp4", 300, 1e6);
  disk_.failOn(Operation::Attributes, path("unknown.mp4"), EIO);
  EXPECT_EQ(files_._srDeleteFilesOlderThanTimeToLiveInSeconds(86400.0), 100);
  EXPECT_EQ(disk_.contentsOfDirectory(kStore).value(),
            (std::vector<std::string>{"limit.mp4", "new.mp4", "unknown.mp4"}));
  EXPECT_EQ(log_.countContaining("_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: 5"), 1u);
  EXPECT_EQ(files_._srDeleteFilesOlderThanTimeToLiveInSeconds(std::nan("")), 0);
  EXPECT_EQ(files_._srDeleteFilesOlderThanTimeToLiveInSeconds(1e300), 0);
  for (const char* seconds : {"86400", "0", "2147483647"}) {
    EXPECT_TRUE(log_.contains(std::string("_srDeleteFilesOlderThanTimeToLiveInSeconds: ") + seconds)) << seconds;
  }
}

TEST_F(TemporaryFilesTest, DeletingAllCountsOnlyWhatWasRemoved) {
  addFile("future.mp4", 7, -50);  // the clock was set back since
  addFile("stuck.mp4", 1000, 50);
  disk_.addFile(path("folder/inner.mp4"), "inner");
  const auto folder = static_cast<int64_t>(disk_.attributesOfItem(path("folder")).value().size);
  addFile("nameless.mp4", 300);
  disk_.failOn(Operation::Remove, path("stuck.mp4"), EBUSY);
  disk_.failOn(Operation::Attributes, path("nameless.mp4"), EIO);
  EXPECT_EQ(files_._srDeleteAllTempFiles(), 7 + folder);
  EXPECT_EQ(disk_.contentsOfDirectory(kStore).value(), std::vector<std::string>{"stuck.mp4"});
  EXPECT_EQ(log_.countContaining("_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: "), 2u);
}

TEST_F(TemporaryFilesTest, AMissingDirectoryHoldsNothing) {
  EXPECT_EQ(files_._srDeleteAllTempFiles(), 0);
  EXPECT_EQ(log_.countContaining("_srDeleteFilesOlderThanTimeToLiveInSeconds, error code: 2"), 1u);
  files_._srDeleteFilesWithPrefix("clip");
  global_.runUntilIdle();
  EXPECT_TRUE(log_.contains("_qvDeleteFilesWithPrefix error: 2"));
  EXPECT_EQ(files_._srGetCreationDateForFile(URL::fileURL(path("none.mp4"))), std::nullopt);
  EXPECT_EQ(files_._srSizeOfTempDir(nullptr), 0);
  std::optional<Error> error;
  EXPECT_EQ(files_._srSizeOfTempDir(&error), 0);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, ENOENT);
  EXPECT_EQ(QVDiskSpace(files_)._srDeviceFreeDiskSpace(), 0u);
  EXPECT_FALSE(QVDiskSpace(files_)._srDeviceHasSufficientFreeSpaceForRecording());
  EXPECT_TRUE(QVDiskSpace(files_)._srDeviceHasSufficientFreeSpaceToContinueRecording()) << "nothing is known";

  disk_.addDirectory(kStore);
  error.reset();
  EXPECT_EQ(files_._srSizeOfTempDir(&error), static_cast<int64_t>(disk_.attributesOfItem(kStore).value().size));
  EXPECT_EQ(error, std::nullopt);
}

TEST_F(TemporaryFilesTest, ARecordingBeginsAboveItsBoundAndGoesOnDownToAnother) {
  disk_.addDirectory(kStore);
  const QVDiskSpace space(files_);
  disk_.setFreeSize(100'000'001);
  EXPECT_TRUE(space._srDeviceHasSufficientFreeSpaceForRecording());
  disk_.setFreeSize(100'000'000);
  EXPECT_FALSE(space._srDeviceHasSufficientFreeSpaceForRecording());
  disk_.setFreeSize(50'000'000);
  EXPECT_TRUE(space._srDeviceHasSufficientFreeSpaceToContinueRecording());
  disk_.setFreeSize(49'999'999);
  EXPECT_FALSE(space._srDeviceHasSufficientFreeSpaceToContinueRecording());
}

TEST_F(TemporaryFilesTest, AMovieIsAFileThatHoldsSomething) {
  addFile("one.mp4", 1);
  addFile("empty.mp4", 0);
  disk_.addDirectory(path("folder.mp4"));
  EXPECT_TRUE(files_.isMovieAt(path("one.mp4")));
  for (const char* name : {"empty.mp4", "folder.mp4", "none.mp4"}) EXPECT_FALSE(files_.isMovieAt(path(name))) << name;
}

TEST_F(TemporaryFilesTest, RemovingAFileWorksInTheBackgroundAndToleratesAMissingOne) {
  addFile("clip 1.mp4", 1);
  addFile("stuck.mp4", 1);
  disk_.failOn(Operation::Remove, path("stuck.mp4"), EBUSY);
  std::vector<int64_t> codes;
  const auto record = [&](const std::optional<Error>& error) { codes.push_back(error ? error->code : 0); };
  files_._srRemoveFile(URL::fileURL(path("clip 1.mp4")), record);
  files_._srRemoveFile(URL::fileURL(path("missing.mp4")), record);
  files_._srRemoveFile(URL::fileURL(path("stuck.mp4")), record);
  files_._srRemoveFile(URL::fileURL(path("missing.mp4")), nullptr);
  EXPECT_TRUE(exists("clip 1.mp4"));
  background_.runUntilIdle();
  EXPECT_FALSE(exists("clip 1.mp4"));
  EXPECT_EQ(codes, (std::vector<int64_t>{0, 0, EBUSY}));
}

TEST_F(TemporaryFilesTest, MovingReplacesTheDestination) {
  addFile("from.mp4", 1);
  addFile("to.mp4", 2);
  std::vector<int64_t> codes;
  const auto move = [&] {
    files_._srMoveFileFromURL(URL::fileURL(path("from.mp4")), URL::fileURL(path("to.mp4")),
                              [&](const std::optional<Error>& error) { codes.push_back(error ? error->code : 0); });
    global_.runUntilIdle();
  };
  move();
  EXPECT_FALSE(exists("from.mp4"));
  EXPECT_EQ(disk_.attributesOfItem(path("to.mp4")).value().size, 1u);
  move();
  EXPECT_EQ(codes, (std::vector<int64_t>{0, ENOENT}));
}

TEST_F(TemporaryFilesTest, DeletingByPrefixGoesOnAfterAFailure) {
  for (const char* name : {"Clip_1.mp4", "clip2.mp4", "myclip.mp4", "clip3.mp4", "cli"}) addFile(name, 1);
  disk_.failOn(Operation::Remove, path("clip2.mp4"), EBUSY);
  files_._srDeleteFilesWithPrefix("clip");
  global_.runUntilIdle();
  EXPECT_EQ(disk_.contentsOfDirectory(kStore).value(), (std::vector<std::string>{"cli", "clip2.mp4", "myclip.mp4"}));
}

}  // namespace
}  // namespace qv
