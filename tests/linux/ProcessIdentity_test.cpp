#include "platform/linux/ProcessIdentity.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>

#include "platform/linux/LinuxPlatform.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/kit/Process.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

constexpr const char kBundle[] = "com.example.shell";

/// A shell as an application, which says when it runs and becomes whatever it is told.
class ProcessIdentityTest : public testing::Test {
 protected:
  ProcessIdentityTest() {
    root_.write("/Applications/Shell/Info.json", R"({"CFBundleIdentifier": "com.example.shell"})");
    root_.write("/etc/quorvel/entitlements/com.example.shell.json", R"({"com.example.right": true})");
    shell_ = install("/Applications/Shell/bin", "/bin/sh");
    std::filesystem::permissions(root_.path(), std::filesystem::perms(0755));
  }
  std::string install(const std::string& directory, const std::string& program) {
    std::filesystem::create_directories(root_.path(directory));
    const std::string path = root_.path(directory) + "/" + std::filesystem::path(program).filename().string();
    std::filesystem::copy_file(program, path);
    return path;
  }
  kit::Process start() {
    kit::Process process(shell_, {"-c", "echo runs; read program <&3; exec $program -c 'echo became; read line <&3'"});
    EXPECT_TRUE(process.awaitLine("runs"));
    return process;
  }
  IPCPeer resolved(pid_t pid, bool isPinned = true) {
    IPCPeer peer;
    peer.processIdentifier = pid;
    peer.userIdentifier = ::geteuid();
    const int handle = isPinned ? static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)) : -1;
    if (isPinned) peer.processHandle = shareFileDescriptor(FileDescriptor(handle));
    linux_.peerResolver()(peer);
    return peer;
  }

  kit::ScratchFolder root_;
  fakes::LogRecorder log_;
  std::string shell_;
  LinuxPlatform linux_{{.root = root_.path(),
                        .bundlePath = {},
                        .preferences = "/Preferences",
                        .preferenceDomain = "com.tarnwick.quorveld",
                        .photoLibrary = "/Movies",
                        .metrics = "/Logs",
                        .watchedPath = "/",
                        .sessionUser = ::geteuid()}};
};

TEST_F(ProcessIdentityTest, HoldsUntilTheProcessBecomesAnotherProgramOrEnds) {
  auto process = start();
  const IPCPeer peer = resolved(process.pid());
  EXPECT_EQ(peer.bundleIdentifier, kBundle);
  EXPECT_EQ(peer.entitlements, (Dictionary{{"com.example.right", Value(true)}}));
  EXPECT_EQ(peer.standing(), PeerStanding::Same);
  const std::string other = install("/Applications/Shell/bin", "/bin/bash");
  ASSERT_TRUE(process.say(other));
  ASSERT_TRUE(process.awaitLine("became"));
  EXPECT_EQ(peer.standing(), PeerStanding::AnotherProgram) << "also of the same bundle";
  const IPCPeer anew = resolved(process.pid());
  EXPECT_EQ(anew.bundleIdentifier, kBundle) << "whoever connects now is that program";
  EXPECT_EQ(anew.standing(), PeerStanding::Same);
  process.kill();
  EXPECT_EQ(anew.standing(), PeerStanding::AnotherProgram);
  EXPECT_EQ(resolved(process.pid()).identity, nullptr);
}

TEST_F(ProcessIdentityTest, WhoIsOutsideOrNotPinnedHasNoBundle) {
  const IPCPeer outside = resolved(::getpid());
  EXPECT_EQ(outside.bundleIdentifier, std::nullopt);
  EXPECT_TRUE(outside.entitlements.empty());
  const auto process = start();
  EXPECT_EQ(resolved(process.pid(), false).bundleIdentifier, std::nullopt);
}

TEST_F(ProcessIdentityTest, HoldsOnlyAsLongAsTheExecutableIsTheBundles) {
  const auto process = start();
  const IPCPeer peer = resolved(process.pid());
  root_.write("/Applications/Shell/Info.json", R"({"CFBundleIdentifier": "com.example.renamed"})");
  EXPECT_EQ(peer.standing(), PeerStanding::Uninstalled);
  const IPCPeer renamed = resolved(process.pid());
  EXPECT_EQ(renamed.standing(), PeerStanding::Same);
  std::filesystem::remove(shell_);
  EXPECT_EQ(renamed.standing(), PeerStanding::Uninstalled);
  EXPECT_EQ(resolved(process.pid()).bundleIdentifier, std::nullopt) << "deleted";
}

TEST_F(ProcessIdentityTest, AnExecutableThatOthersCanWriteHasNoEntitlements) {
  const auto process = start();
  for (const char* path : {"/Applications/Shell/bin/sh", "/Applications/Shell/bin", "/Applications"}) {
    struct stat before {};
    ASSERT_EQ(::stat(root_.path(path).c_str(), &before), 0);
    for (const mode_t mode : {0775u, 0757u}) {
      log_.clear();
      ASSERT_EQ(::chmod(root_.path(path).c_str(), mode), 0);
      const IPCPeer peer = resolved(process.pid());
      EXPECT_EQ(peer.bundleIdentifier, kBundle) << path;
      EXPECT_TRUE(peer.entitlements.empty()) << path;
      EXPECT_EQ(log_.countContaining("could have written " + root_.path(path)), 1u);
    }
    ASSERT_EQ(::chmod(root_.path(path).c_str(), before.st_mode & 07777), 0);
  }
  ASSERT_EQ(::chmod(root_.path("/Applications").c_str(), 01777), 0);
  EXPECT_FALSE(resolved(process.pid()).entitlements.empty()) << "nobody else can replace what is there";
  if (::geteuid() != 0) GTEST_SKIP() << "another owner takes root";
  ASSERT_EQ(::chown(shell_.c_str(), 12345, 0), 0);
  EXPECT_TRUE(resolved(process.pid()).entitlements.empty());
}

TEST_F(ProcessIdentityTest, AProcessIsOfItsEffectiveUser) {
  EXPECT_EQ(linux_.bundles().userOfProcess(::getpid()), ::geteuid());
  EXPECT_EQ(linux_.bundles().userOfProcess(0), std::nullopt);
  if (::geteuid() != 0) GTEST_SKIP() << "another user's process takes root";
  kit::Process other("setpriv", {"--reuid", "12345", "--clear-groups", "/bin/sh", "-c", "echo runs; read line <&3"});
  ASSERT_TRUE(other.awaitLine("runs"));
  EXPECT_EQ(linux_.bundles().userOfProcess(other.pid()), 12345u);
}

}  // namespace
}  // namespace qv::platform
