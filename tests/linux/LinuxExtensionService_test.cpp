#include "platform/linux/LinuxExtensionService.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "protocol/ExtensionRequests.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/linux/ExtensionStage.h"

namespace qv::platform {
namespace {

using LinuxExtensionServiceTest = ExtensionStage;

class TestContext final : public ExtensionHostContext {
 public:
  const IPCInterface& _extensionAuxiliaryHostProtocol() const override { return extensionRequestHostProtocol(); }
  const IPCInterface& _extensionAuxiliaryVendorProtocol() const override { return extensionRequestProtocol(); }
  void didConnectToVendor(const std::shared_ptr<IPCConnection>& to) override { vendor = to; }
  std::weak_ptr<IPCConnection> vendor;
};

TEST_F(LinuxExtensionServiceTest, FindsWhatIsInstalledAndLeavesOutWhatIsBroken) {
  root_.write(kUploadBundle + "/Resources/en.lproj/InfoPlist.json", R"({"CFBundleDisplayName":"Send it"})");
  root_.write(kUploadBundle + "/Resources/icon.png", "\x89PNG\r\n\x1a\nrest");
  root_.write("/Applications/A/Info.json", "this is no manifest");
  root_.write("/Applications/B/Info.json", R"({"CFBundleIdentifier":"b","QVExtension":"no dictionary"})");
  root_.write("/Applications/C/Info.json", infoOf("c", "../../../usr/bin/true"));
  root_.write("/Applications/D/Info.json", infoOf("d"));
  std::filesystem::create_directories(root_.path("/Applications/D/bin"));
  std::filesystem::create_symlink("/usr/bin/true", root_.path("/Applications/D/bin/up"));
  install("/System/Applications/Other", "com.example.other");
  install("/System/Applications/Twice", "com.example.other");
  const fakes::LogRecorder log;

  const auto found = find();
  ASSERT_EQ(found.size(), 2u);
  EXPECT_EQ(found[0]->identifier, "com.example.game.upload");
  EXPECT_EQ(found[0]->displayName, "Send it");
  EXPECT_EQ(found[0]->icons.size(), 1u);
  EXPECT_EQ(found[0]->bundlePath, root_.path(kUploadBundle));
  EXPECT_NE(platform::find(found[0]->attributes.at(extensioninfo::kActivationRule).asDictionary(), "x"), nullptr);
  EXPECT_EQ(found[1]->bundlePath, root_.path("/System/Applications/Other"));
  EXPECT_TRUE(found[1]->icons.empty());
  EXPECT_EQ(log.countContaining("is left out: "), 6u) << "B, C, D, Twice, and an icon of two";
  EXPECT_TRUE(find({{extensioninfo::kPointIdentifier, "another.point"}}).empty());
}

TEST_F(LinuxExtensionServiceTest, CompletesEachRequestWithItsOwnItems) {
  service_.setHostContextClass(kPoint, [] { return std::make_shared<TestContext>(); });
  const auto held = begin("hold");
  const auto [id, error] = held->began.next();
  ASSERT_EQ(error, 0);
  const auto context = std::dynamic_pointer_cast<TestContext>(service_.contextForRequest(id));
  ASSERT_NE(context, nullptr);
  EXPECT_EQ(context->vendor.lock(), service_.auxiliaryConnectionForRequest(id));
  EXPECT_EQ(run("echo", "second"), "second");
  EXPECT_TRUE(held->completed.isEmpty());
  const fakes::LogRecorder log;
  EXPECT_EQ(run("flood"), failure(EMSGSIZE));
  EXPECT_EQ(log.countContaining("which it does not have"), 16u);
  EXPECT_EQ(run("release"), "ok");
  EXPECT_EQ(held->completed.next(), "released");
  EXPECT_EQ(held->began.count() + held->completed.count(), 0u);
}

TEST_F(LinuxExtensionServiceTest, LosesOnlyTheRequestsOfAProcessThatDies) {
  const auto held = begin("hold");
  const auto id = held->began.next().first;
  const auto crashing = begin("crash");
  EXPECT_EQ(crashing->began.next().second, ECONNRESET);
  EXPECT_EQ(held->completed.next(), failure(ECONNRESET));

  const auto second = begin("hold");
  EXPECT_GT(second->began.next().first, id) << "a new process";
  use_.reset();
  EXPECT_EQ(run("echo", "third process"), "third process");
  EXPECT_EQ(second->completed.next(), failure(ECONNRESET));
}

TEST_F(LinuxExtensionServiceTest, GivesUpOnAnExtensionThatDoesNotAnswer) {
  const auto held = begin("hold");
  held->began.next();
  const auto hanging = begin("hang");
  EXPECT_EQ(held->completed.next(), "hanging") << "the extension has the second request";
  timers_.advance(std::chrono::seconds(10));
  EXPECT_EQ(hanging->began.next().second, ETIMEDOUT);
  const fakes::LogRecorder log;
  EXPECT_EQ(run("echo", "again"), "again");

  std::filesystem::remove(root_.path(kUploadBundle + "/bin/up"));
  use_.reset();
  EXPECT_EQ(begin("echo")->began.next().second, ENOEXEC);
}

TEST_F(LinuxExtensionServiceTest, UsesOfOneExtensionDoNotMeet) {
  const auto first = begin("hold");
  const auto other = service_.useExtension(extension_);
  const auto second = beginOn(*other, "hold");
  EXPECT_EQ(first->began.next().second, 0);
  EXPECT_EQ(second->began.next().second, 0);
  const auto hanging = begin("hang");
  EXPECT_EQ(first->completed.next(), "hanging");
  use_.reset();
  EXPECT_EQ(run("echo", "at once"), "at once") << "not by the process that hangs, or dies";
  EXPECT_EQ(hanging->began.next().second, ECONNRESET);
  EXPECT_EQ(beginOn(*other, "release")->completed.next(), "ok");
  EXPECT_EQ(second->completed.next(), "released");

  std::vector<std::shared_ptr<ExtensionUse>> uses;
  for (int i = 0; i < 8; ++i) uses.push_back(service_.useExtension(extension_));
  EXPECT_EQ(beginOn(*uses.back(), "echo")->began.next().second, EBUSY);
}

TEST_F(LinuxExtensionServiceTest, ReachesItsContainerTheNetworkAndNothingElse) {
  const std::string data = "/private/var/mobile";
  EXPECT_EQ(run("write home", "kept"), "ok");
  EXPECT_TRUE(root_.exists(data + "/Containers/com.example.game.upload/kept"));
  EXPECT_EQ(run("network socket"), "ok");
  EXPECT_EQ(run("user") != std::to_string(::getuid()), ::geteuid() == 0);
  const std::string movie = root_.write(data + "/Library/Quorvel/movie.mp4", "secret");
  for (const std::string& path :
       {movie, root_.write(data + "/Media/Movies/old.mp4", "secret"),
        root_.write(data + "/Containers/com.example.other/token", "secret"), root_.path("/Applications/Game"),
        std::string("/etc/shadow"), "/proc/" + std::to_string(::getpid()) + "/environ"}) {
    EXPECT_TRUE(isRefused("read", path)) << path;
  }
  EXPECT_EQ(run("environment", "TMPDIR"), "set");
  EXPECT_EQ(run("environment", "PWD"), "unset");
}

TEST_F(LinuxExtensionServiceTest, OpensOneFileByItsTokenOnce) {
  install("/System/Applications/Other", "com.example.other");
  const auto other = service_.useExtension(find().at(1));
  const std::string clip = root_.write("/private/var/mobile/Library/Quorvel/clip.mp4", "frames");
  ASSERT_EQ(::chmod(clip.c_str(), 0600), 0);
  ASSERT_EQ(::chmod(root_.path("/private/var/mobile/Library/Quorvel").c_str(), 0700), 0);
  std::filesystem::create_symlink(clip, clip + ".link");
  EXPECT_FALSE(use().issueSandboxToken(kReadOnly, clip + ".link"));
  EXPECT_FALSE(use().issueSandboxToken(kReadOnly, root_.path("/private")));
  EXPECT_FALSE(use().issueSandboxToken("another.class", clip));

  const auto token = use().issueSandboxToken(kReadOnly, clip).value();
  EXPECT_EQ(beginOn(*other, "open token", token)->completed.next(), kNoSuchFileErrorName) << "another extension's";
  const auto same = service_.useExtension(extension_);
  EXPECT_EQ(beginOn(*same, "open token", token)->completed.next(), kNoSuchFileErrorName) << "another broadcast's";
  root_.write("/private/var/mobile/Library/Quorvel/other", "swapped");
  std::filesystem::rename(root_.path("/private/var/mobile/Library/Quorvel/other"), clip);
  EXPECT_EQ(run("open token", token), "frames");
  EXPECT_EQ(run("open token", token), kNoSuchFileErrorName) << "used";

  const auto revoked = use().issueSandboxToken(kReadOnly, clip).value();
  use().revokeSandboxToken(revoked);
  EXPECT_EQ(run("open token", revoked), kNoSuchFileErrorName);
  const auto unused = use().issueSandboxToken(kReadOnly, clip).value();
  EXPECT_EQ(run("echo", unused), unused);
  EXPECT_EQ(run("open token", unused), kNoSuchFileErrorName) << "ended with its request";
}

}  // namespace
}  // namespace qv::platform
