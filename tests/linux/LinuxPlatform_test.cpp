#include "platform/linux/LinuxPlatform.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <filesystem>

#include "support/QuorvelErrors.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

LinuxDevice device(const kit::ScratchFolder& root, const std::string& bundlePath = {}) {
  return {.root = root.path(),
          .bundlePath = bundlePath,
          .preferences = "/Preferences",
          .preferenceDomain = "com.tarnwick.quorveld",
          .photoLibrary = "/Movies",
          .metrics = "/Logs",
          .watchedPath = "/",
          .sessionUser = ::geteuid()};
}

IPCPeer thisProcess() {
  IPCPeer peer;
  peer.processIdentifier = ::getpid();
  peer.userIdentifier = ::getuid();
  peer.processHandle = shareFileDescriptor(FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, ::getpid(), 0))));
  return peer;
}

TEST(LinuxPlatformTest, ErrorsSpeakTheUsersLanguageOnARealDisk) {
  kit::ScratchFolder root;
  const std::filesystem::path framework = root.path("/System/Library/Frameworks/Quorvel.framework");
  std::filesystem::create_directories(framework.parent_path());
  std::filesystem::copy(QV_FRAMEWORK_DIR, framework, std::filesystem::copy_options::recursive);
  root.write("/Preferences/com.tarnwick.quorveld.json", R"({"Languages": ["de-CH"]})");
  LinuxPlatform linux_(device(root));
  Platform platform;
  linux_.addTo(platform);
  const QVBundleTexts texts(platform);
  EXPECT_EQ(QuorvelErrors(texts)._qvUserErrorForCode(errorcode::kFailed).localizedDescription(),
            "Die Aufnahme ist fehlgeschlagen.");
}

TEST(LinuxPlatformTest, PeersAreKnownByTheBundleAroundTheirExecutable) {
  fakes::LogRecorder log;
  kit::ScratchFolder root;
  const std::string entitlements = "/etc/quorvel/entitlements/com.example.test.json";
  root.write(entitlements, R"({"com.tarnwick.private.quorvel": true})");
  std::filesystem::permissions(root.path(entitlements), std::filesystem::perms(0644));
  std::filesystem::permissions(root.path("/etc/quorvel/entitlements"), std::filesystem::perms(0755));
  // This test's own program becomes an application.
  const std::filesystem::path directory = std::filesystem::read_symlink("/proc/self/exe").parent_path();
  const std::filesystem::path info = directory / "Info.json";
  kit::ScratchFolder other;
  std::filesystem::copy_file(other.write("/Info.json", R"({"CFBundleIdentifier": "com.example.test"})"), info);

  LinuxPlatform linux_(device(root, directory.parent_path()));
  IPCPeer peer = thisProcess();
  linux_.peerResolver()(peer);
  EXPECT_EQ(peer.bundleIdentifier, "com.example.test");
  EXPECT_EQ(valueForKey(peer.entitlements, "com.tarnwick.private.quorvel"), Value(true));

  IPCPeer unpinned = thisProcess();
  unpinned.processHandle = nullptr;
  linux_.peerResolver()(unpinned);
  EXPECT_EQ(unpinned.bundleIdentifier, std::nullopt);
  std::filesystem::remove(info);

  IPCPeer outside = thisProcess();
  LinuxPlatform(device(root)).peerResolver()(outside);
  EXPECT_EQ(outside.bundleIdentifier, std::nullopt);
  EXPECT_TRUE(outside.entitlements.empty());
}

}  // namespace
}  // namespace qv::platform
