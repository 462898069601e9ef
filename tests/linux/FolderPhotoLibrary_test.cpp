#include "platform/linux/FolderPhotoLibrary.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>

#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ManualExecutor.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

class FolderPhotoLibraryTest : public testing::Test {
 protected:
  explicit FolderPhotoLibraryTest(uid_t user = ::geteuid()) : library_(root_.path(kFolder), user, executor_) {}
  int64_t add(const std::string& path, PhotoResourceType type = PhotoResourceType::Video) {
    std::optional<int64_t> code;
    library_.createAsset(URL::fileURL(path), type,
                         [&](const std::optional<Error>& error) { code = error ? error->code : 0; });
    EXPECT_EQ(code, std::nullopt);
    executor_.runUntilIdle();
    return code.value_or(-1);
  }
  std::set<std::string> names() {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(root_.path(kFolder))) {
      names.insert(entry.path().filename());
    }
    return names;
  }

  static inline const std::string kFolder = "/private/var/mobile/Media/Movies";
  kit::ScratchFolder root_;
  fakes::LogRecorder log_;
  fakes::ManualExecutor executor_;
  FolderPhotoLibrary library_;
};

TEST_F(FolderPhotoLibraryTest, MoviesKeepTheirNamesAndReplaceNothing) {
  const std::string content(2'500'000, 'm');
  const std::string movie = root_.write("/tmp/My movie.mp4", content);
  EXPECT_EQ(add(movie), 0);
  root_.write("/tmp/My movie.mp4", "another");
  EXPECT_EQ(add(movie), 0);
  EXPECT_EQ(names(), (std::set<std::string>{"My movie.mp4", "My movie 2.mp4"}));
  EXPECT_EQ(root_.read(kFolder + "/My movie.mp4"), content);
  EXPECT_EQ(root_.read(kFolder + "/My movie 2.mp4"), "another");
  EXPECT_TRUE(root_.exists("/tmp/My movie.mp4")) << "the source stays";
}

TEST_F(FolderPhotoLibraryTest, OnlyRegularFilesAreTaken) {
  const std::string movie = root_.write("/tmp/movie.mp4", "m");
  std::filesystem::create_symlink(movie, root_.path("/tmp/link.mp4"));
  ASSERT_EQ(::mkfifo(root_.path("/tmp/pipe.mp4").c_str(), 0600), 0);
  EXPECT_EQ(add(root_.path("/tmp/link.mp4")), EINVAL);
  EXPECT_EQ(add(root_.path("/tmp/pipe.mp4")), EINVAL);
  EXPECT_EQ(add(root_.path("/tmp")), EINVAL);
  EXPECT_EQ(add(root_.path("/tmp/missing.mp4")), ENOENT);
  EXPECT_EQ(add(movie, static_cast<PhotoResourceType>(1)), EINVAL);
  EXPECT_EQ(log_.countContaining("photo library"), 5u);
  EXPECT_FALSE(root_.exists(kFolder));
}

TEST_F(FolderPhotoLibraryTest, UnfinishedCopiesOfAFormerProcessGo) {
  root_.write(kFolder + "/.quorvel-copy-abc123", "half");
  root_.write(kFolder + "/.keep", "");
  EXPECT_EQ(add(root_.write("/tmp/movie.mp4", "m")), 0);
  EXPECT_EQ(names(), (std::set<std::string>{".keep", "movie.mp4"}));
}

TEST_F(FolderPhotoLibraryTest, AnUnusableFolderIsAnError) {
  root_.write("/private/var/mobile/Media", "a file in the way");
  EXPECT_EQ(add(root_.write("/tmp/movie.mp4", "m")), ENOTDIR);
}

/// A daemon of root, and the library of a user who may write where it lies.
class UserPhotoLibraryTest : public FolderPhotoLibraryTest {
 protected:
  static constexpr uid_t kUser = 4711;

  UserPhotoLibraryTest() : FolderPhotoLibraryTest(kUser) {}
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "to give files to another user takes root";
  }
  void expect(const std::string& path, uid_t owner, unsigned mode) {
    struct stat info {};
    ASSERT_EQ(::lstat(root_.path(path).c_str(), &info), 0) << path;
    EXPECT_EQ(info.st_uid, owner) << path;
    EXPECT_EQ(info.st_mode & 07777, mode) << path;
  }

  const std::string movie_ = root_.write("/store/Chess.mp4", "a movie");
};

TEST_F(UserPhotoLibraryTest, FolderAndMoviesAreTheUsersAlone) {
  EXPECT_EQ(add(movie_), 0);
  expect(kFolder, kUser, 0700);
  expect(kFolder + "/Chess.mp4", kUser, 0600);
  // Who owns it may let others in.
  ASSERT_EQ(::chmod(root_.path(kFolder).c_str(), 0755), 0);
  EXPECT_EQ(add(movie_), 0);
  expect(kFolder, kUser, 0755);
  expect(kFolder + "/Chess 2.mp4", kUser, 0600);
}

TEST_F(UserPhotoLibraryTest, ALibraryThatWasRootsIsGivenWithItsMoviesAndNothingElse) {
  root_.write(kFolder + "/old.mp4", "old");
  const std::string secret = root_.write("/etc/secret", "root's");
  ASSERT_EQ(::symlink(secret.c_str(), root_.path(kFolder + "/link").c_str()), 0);
  ASSERT_EQ(::link(secret.c_str(), root_.path(kFolder + "/hard.mp4").c_str()), 0);
  ASSERT_EQ(::chmod(secret.c_str(), 0640), 0);
  EXPECT_EQ(add(movie_), 0);
  expect(kFolder, kUser, 0700);
  expect(kFolder + "/old.mp4", kUser, 0600);
  expect("/etc/secret", 0, 0640);
}

TEST_F(UserPhotoLibraryTest, LinksOfTheUserLeadNowhere) {
  const std::string secret = root_.write("/etc/secret", "root's");
  EXPECT_EQ(add(movie_), 0);
  ASSERT_EQ(::symlink(secret.c_str(), root_.path(kFolder + "/Chess 2.mp4").c_str()), 0);
  EXPECT_EQ(add(movie_), 0);
  expect(kFolder + "/Chess 3.mp4", kUser, 0600);
  EXPECT_EQ(root_.read("/etc/secret"), "root's");
  // In place of the whole folder.
  ASSERT_EQ(::rename(root_.path(kFolder).c_str(), root_.path("/private/var/mobile/Media/away").c_str()), 0);
  ASSERT_EQ(::symlink(root_.path("/etc").c_str(), root_.path(kFolder).c_str()), 0);
  EXPECT_EQ(add(movie_), ENOTDIR);
  expect("/etc", 0, 0755);
  EXPECT_FALSE(root_.exists("/etc/Chess.mp4"));
}

TEST_F(UserPhotoLibraryTest, AFolderOfAThirdUserIsRefused) {
  root_.write(kFolder + "/theirs.mp4", "theirs");
  ASSERT_EQ(::chown(root_.path(kFolder).c_str(), kUser + 1, 0), 0);
  EXPECT_EQ(add(movie_), EPERM);
  expect(kFolder, kUser + 1, 0755);
}

}  // namespace
}  // namespace qv::platform
