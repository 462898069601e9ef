#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>

#include "platform/linux/FolderPhotoLibrary.h"
#include "tests/fakes/ManualExecutor.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

/// A daemon of root, and the library of a user who may write where it lies.
class UserPhotoLibraryTest : public testing::Test {
 protected:
  static constexpr uid_t kUser = 4711;

  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "to give files to another user takes root";
  }
  int64_t add() {
    int64_t code = -1;
    library_.createAsset(URL::fileURL(movie_), PhotoResourceType::Video,
                         [&](const std::optional<Error>& error) { code = error ? error->code : 0; });
    executor_.runUntilIdle();
    return code;
  }
  void expect(const std::string& path, uid_t owner, unsigned mode) {
    struct stat info {};
    ASSERT_EQ(::lstat(root_.path(path).c_str(), &info), 0) << path;
    EXPECT_EQ(info.st_uid, owner) << path;
    EXPECT_EQ(info.st_mode & 07777, mode) << path;
  }

  const kit::ScratchFolder root_;
  const std::string movie_ = root_.write("/store/Chess.mp4", "a movie");
  fakes::ManualExecutor executor_;
  FolderPhotoLibrary library_{root_.path("/Media/Movies"), kUser, executor_};
};

TEST_F(UserPhotoLibraryTest, FolderAndMoviesAreTheUsersAlone) {
  EXPECT_EQ(add(), 0);
  expect("/Media/Movies", kUser, 0700);
  expect("/Media/Movies/Chess.mp4", kUser, 0600);
  // Who owns it may let others in.
  ASSERT_EQ(::chmod(root_.path("/Media/Movies").c_str(), 0755), 0);
  EXPECT_EQ(add(), 0);
  expect("/Media/Movies", kUser, 0755);
  expect("/Media/Movies/Chess 2.mp4", kUser, 0600);
}

TEST_F(UserPhotoLibraryTest, ALibraryThatWasRootsIsGivenWithItsMoviesAndNothingElse) {
  root_.write("/Media/Movies/old.mp4", "old");
  const std::string secret = root_.write("/etc/secret", "root's");
  ASSERT_EQ(::symlink(secret.c_str(), root_.path("/Media/Movies/link").c_str()), 0);
  ASSERT_EQ(::link(secret.c_str(), root_.path("/Media/Movies/hard.mp4").c_str()), 0);
  ASSERT_EQ(::chmod(secret.c_str(), 0640), 0);
  EXPECT_EQ(add(), 0);
  expect("/Media/Movies", kUser, 0700);
  expect("/Media/Movies/old.mp4", kUser, 0600);
  expect("/etc/secret", 0, 0640);
}

TEST_F(UserPhotoLibraryTest, LinksOfTheUserLeadNowhere) {
  const std::string secret = root_.write("/etc/secret", "root's");
  EXPECT_EQ(add(), 0);
  ASSERT_EQ(::symlink(secret.c_str(), root_.path("/Media/Movies/Chess 2.mp4").c_str()), 0);
  EXPECT_EQ(add(), 0);
  expect("/Media/Movies/Chess 3.mp4", kUser, 0600);
  EXPECT_EQ(root_.read("/etc/secret"), "root's");
  // In place of the whole folder.
  ASSERT_EQ(::rename(root_.path("/Media/Movies").c_str(), root_.path("/Media/away").c_str()), 0);
  ASSERT_EQ(::symlink(root_.path("/etc").c_str(), root_.path("/Media/Movies").c_str()), 0);
  EXPECT_EQ(add(), ENOTDIR);
  expect("/etc", 0, 0755);
  EXPECT_FALSE(root_.exists("/etc/Chess.mp4"));
}

TEST_F(UserPhotoLibraryTest, AFolderOfAThirdUserIsRefused) {
  root_.write("/Media/Movies/theirs.mp4", "theirs");
  ASSERT_EQ(::chown(root_.path("/Media/Movies").c_str(), kUser + 1, 0), 0);
  EXPECT_EQ(add(), EPERM);
  expect("/Media/Movies", kUser + 1, 0755);
}

}  // namespace
}  // namespace qv::platform
