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
  FolderPhotoLibrary library_{root_.path(kFolder), ::geteuid(), executor_};
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

}  // namespace
}  // namespace qv::platform
