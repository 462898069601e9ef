#include "platform/linux/PosixFileSystem.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>

#include "platform/linux/SmallFile.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

class PosixFileSystemTest : public testing::Test {
 protected:
  static int64_t code(const std::optional<Error>& error) { return error ? error->code : 0; }
  kit::ScratchFolder root_;
  PosixFileSystem disk_;
};

TEST_F(PosixFileSystemTest, DirectoriesAreMadeListedAndRemovedWithTheirContents) {
  EXPECT_EQ(code(disk_.createDirectory(root_.path("/a/b"))), ENOENT);
  EXPECT_EQ(code(disk_.createDirectory(root_.path("/a"))), 0);
  EXPECT_EQ(code(disk_.createDirectory(root_.path("/a"))), EEXIST);
  root_.write("/a/.hidden", "");
  root_.write("/a/b/deep", "");
  const auto names = disk_.contentsOfDirectory(root_.path("/a/"));
  ASSERT_TRUE(names);
  EXPECT_EQ(std::set(names.value().begin(), names.value().end()), (std::set<std::string>{".hidden", "b"}));
  EXPECT_EQ(code(disk_.removeItem(root_.path("/a//b"))), 0);
  EXPECT_FALSE(root_.exists("/a/b"));
  EXPECT_EQ(code(disk_.removeItem(root_.path("/a/b"))), ENOENT);
  EXPECT_EQ(disk_.contentsOfDirectory(root_.path("/a/b")).error().code, ENOENT);
}

TEST_F(PosixFileSystemTest, AttributesAndRemovalStopAtLinks) {
  const std::string target = root_.write("/target/file", "12345");
  std::filesystem::create_symlink(root_.path("/target"), root_.path("/link"));
  std::filesystem::create_symlink("/nowhere/at/all", root_.path("/dangling"));
  EXPECT_TRUE(disk_.itemExists(root_.path("/dangling")));
  EXPECT_FALSE(disk_.attributesOfItem(root_.path("/link")).value().isDirectory);
  EXPECT_EQ(code(disk_.removeItem(root_.path("/link"))), 0);
  const auto attributes = disk_.attributesOfItem(target);
  ASSERT_TRUE(attributes);
  EXPECT_EQ(attributes.value().size, 5u);
  EXPECT_GT(attributes.value().creationDate.secondsSince1970, 1e9);
  EXPECT_TRUE(disk_.attributesOfItem(root_.path("/target")).value().isDirectory);
}

TEST_F(PosixFileSystemTest, MovesReplaceNothing) {
  const std::string a = root_.write("/a", "a");
  const std::string b = root_.write("/b", "b");
  EXPECT_EQ(code(disk_.moveItem(a, b)), EEXIST);
  EXPECT_EQ(root_.read("/b"), "b");
  EXPECT_EQ(code(disk_.moveItem(a, root_.path("/c"))), 0);
  EXPECT_EQ(root_.read("/c"), "a");
  EXPECT_EQ(code(disk_.moveItem(a, root_.path("/d"))), ENOENT);
}

TEST_F(PosixFileSystemTest, MovesToAnotherFileSystemCopyFilesOnly) {
  struct stat here {};
  struct stat there {};
  ASSERT_EQ(::stat(root_.path().c_str(), &here), 0);
  if (::stat("/dev/shm", &there) != 0 || here.st_dev == there.st_dev) GTEST_SKIP() << "no second file system";
  const std::string destination = "/dev/shm/" + std::filesystem::path(root_.path()).filename().string();
  const std::string content(3'000'000, 'x');
  EXPECT_EQ(code(disk_.moveItem(root_.write("/movie", content), destination)), 0);
  EXPECT_FALSE(root_.exists("/movie"));
  EXPECT_EQ(disk_.attributesOfItem(destination).value().size, content.size());
  EXPECT_EQ(code(disk_.moveItem(root_.write("/movie", "again"), destination)), EEXIST);
  EXPECT_TRUE(root_.exists("/movie"));
  std::filesystem::create_directory(root_.path("/folder"));
  EXPECT_EQ(code(disk_.moveItem(root_.path("/folder"), destination + "2")), EXDEV);
  EXPECT_EQ(code(disk_.removeItem(destination)), 0);
}

TEST_F(PosixFileSystemTest, SmallFilesAreBoundedAndNeverBlock) {
  EXPECT_EQ(disk_.readFile(root_.write("/small", std::string("a\0b", 3))).value(), std::string("a\0b", 3));
  EXPECT_TRUE(disk_.readFile(root_.write("/limit", std::string(kMaximumSmallFileSize, 'x'))));
  EXPECT_EQ(disk_.readFile(root_.write("/large", std::string(kMaximumSmallFileSize + 1, 'x'))).error().code, EFBIG);
  EXPECT_EQ(disk_.readFile("/dev/zero").error().code, EINVAL);
  EXPECT_EQ(disk_.readFile(root_.path()).error().code, EINVAL);
  ASSERT_EQ(::mkfifo(root_.path("/pipe").c_str(), 0600), 0);
  EXPECT_EQ(disk_.readFile(root_.path("/pipe")).error().code, EINVAL);
}

TEST_F(PosixFileSystemTest, FreeSpaceIsThatOfTheFileSystem) {
  EXPECT_GT(disk_.freeSizeOfFileSystem(root_.path()).value(), 0u);
  EXPECT_EQ(disk_.freeSizeOfFileSystem(root_.path("/none")).error().code, ENOENT);
}

}  // namespace
}  // namespace qv::platform
