// What runs with an extension's process, each part by itself.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "platform/linux/ContainerUse.h"
#include "platform/linux/ExtensionBounds.h"
#include "platform/linux/ExtensionCgroups.h"
#include "platform/linux/ExtensionUsers.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/kit/Process.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

constexpr UserRange kThree{500'000, 3};

class ExtensionUsersTest : public ::testing::Test {
 protected:
  uid_t userOf(const std::string& extension) {
    ExtensionUsers afterRestart(root_.path(), kThree);
    auto user = afterRestart.userOf(extension);
    return user ? *user : 0;
  }
  kit::ScratchFolder root_;
};

TEST_F(ExtensionUsersTest, StayAndAreNeverShared) {
  EXPECT_EQ(userOf("a"), 500'000u);
  EXPECT_EQ(userOf("b"), 500'001u);
  EXPECT_EQ(userOf("a"), 500'000u);
  struct stat info {};
  ASSERT_EQ(::stat((root_ / ".users.json").c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0600u);

  std::filesystem::create_directory(root_ / "a");
  std::filesystem::create_directory(root_ / "b");
  EXPECT_EQ(userOf("c"), 500'002u);
  EXPECT_EQ(userOf("d"), 500'002u) << "that of c, which has no container any more";
  std::filesystem::create_directory(root_ / "d");
  EXPECT_EQ(userOf("e"), 0u) << "all have containers";

  ExtensionUsers users(root_.path(), kThree);
  std::filesystem::remove(root_ / "a");
  EXPECT_EQ(*users.userOf("a"), 500'000u);
  EXPECT_FALSE(users.userOf("e")) << "a may still run";
}

TEST_F(ExtensionUsersTest, AreKnownByTheirContainersWhereTheFileIsLost) {
  if (::geteuid() != 0) GTEST_SKIP() << "another's container takes root";
  std::filesystem::create_directory(root_ / "b");
  ASSERT_EQ(::chown((root_ / "b").c_str(), 500'000, 500'000), 0);
  for (const std::string content : {"{\"a\":", R"({"x": 0, "y": -1, "z": 499999, "v": "500001", "w": 500003})"}) {
    root_.write("/.users.json", content);
    EXPECT_EQ(userOf("b"), 500'000u);
    EXPECT_EQ(userOf("a"), 500'001u);
  }
  root_.write("/.users.json", R"({"c": 500000, "a": 500000})");
  EXPECT_NE(userOf("a"), userOf("c"));
}

TEST(ContainerUseTest, CountsWhatLiesThereAndFollowsNoLink) {
  kit::ScratchFolder root;
  const auto use = [&] { return countContainerUse(root / "in", ::getpid()); };
  root.write("/in/deeper/file", std::string(100'000, 'x'));
  root.write("/out/file", std::string(1'000'000, 'x'));
  std::filesystem::create_symlink(root / "out", root / "in/link");
  const ContainerUse before = use();
  EXPECT_GE(before.bytes, 100'000u);
  EXPECT_LT(before.bytes, 500'000u);
  EXPECT_EQ(before.entries, 3u);
  {
    const FileDescriptor open(
        ::open((root.write("/in/gone", std::string(200'000, 'x'))).c_str(), O_RDONLY | O_CLOEXEC));
    std::filesystem::remove(root / "in/gone");
    EXPECT_GE(use().bytes, before.bytes + 200'000);
  }
  EXPECT_EQ(use().bytes, before.bytes);
  std::string deep = root / "in";
  for (int i = 0; i <= extensionbounds::kContainerDepth; ++i) std::filesystem::create_directory(deep += "/d");
  EXPECT_GT(use().entries, extensionbounds::kContainerEntries);
}

/// Threading: one thread.
class DelegatedCgroup {
 public:
  ~DelegatedCgroup() {
    ::rmdir((path + "/daemon").c_str());
    ::rmdir(path.c_str());
  }
  bool make() {
    for (const std::string mount : {"/sys/fs/cgroup", "/sys/fs/cgroup/unified"}) {
      path = mount + "/quorveld-test-" + std::to_string(::getpid());
      if (std::filesystem::exists(mount + "/cgroup.controllers") && ::mkdir(path.c_str(), 0755) == 0) return true;
    }
    return false;
  }
  std::string path;
};

TEST(ExtensionCgroupsTest, EndAllThatRunsInThem) {
  DelegatedCgroup delegated;
  if (!delegated.make()) GTEST_SKIP() << "no cgroup can be made";
  kit::Process sleeper("sleep", {"1000"}), beside("sleep", {"1000"});
  const fakes::LogRecorder log;
  ExtensionCgroups cgroups(delegated.path);
  auto first = cgroups.make(), second = cgroups.make();
  ASSERT_TRUE(first && second);
  EXPECT_EQ(log.countContaining("cgroups of their own"), 1u);
  ASSERT_FALSE(first->add(sleeper.pid()));
  ASSERT_FALSE(second->add(beside.pid()));
  first.reset();
  EXPECT_EQ(sleeper.wait(), -1) << "killed";
  EXPECT_EQ(::kill(beside.pid(), 0), 0);
}

TEST(ExtensionCgroupsTest, AreLeftOutWhereNoneIsDelegated) {
  const fakes::LogRecorder log;
  ExtensionCgroups cgroups("");
  EXPECT_EQ(cgroups.make(), nullptr);
  EXPECT_EQ(cgroups.make(), nullptr);
  EXPECT_EQ(log.countContaining("no cgroup is delegated"), 1u);
}

}  // namespace
}  // namespace qv::platform
