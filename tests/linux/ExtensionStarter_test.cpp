// Extensions that the service of their own starts, over its socket.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <thread>

#include "platform/linux/ExtensionUsers.h"
#include "platform/linux/RemoteExtensionStarter.h"
#include "platform/linux/RouteReachability.h"
#include "tests/linux/ExtensionStage.h"

namespace qv::platform {
namespace {

constexpr const char kUpload[] = "com.example.game.upload";
constexpr uid_t kStranger = 4711;

std::string socketOf(const std::string& root) { return root + "/extensions"; }

class ExtensionStarterTest : public ExtensionStage {
 protected:
  ExtensionStarterTest()
      : ExtensionStage(
            [](const std::string& root) { return std::make_unique<RemoteExtensionStarter>(socketOf(root)); }),
        remote_(socketOf(root_.path())) {}
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "the service is root";
    FileDescriptor listening(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    std::strcpy(address.sun_path, socketOf(root_.path()).c_str());
    ASSERT_EQ(::bind(listening.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(listening.get(), 8), 0);
    listening_ = shareFileDescriptor(std::move(listening));
    startService();
  }
  /// As the service manager does: the socket is there before it, and outlives it.
  void startService() {
    SpawnRequest request;
    request.program = EXTENSION_SERVICE;
    request.environment = {"QUORVEL_DEVICE_ROOT=" + root_.path()};
    for (char** entry = environ; *entry != nullptr; ++entry) request.environment.emplace_back(*entry);
    request.descriptors = {listening_};
    auto started = SpawnedProcess::start(std::move(request));
    ASSERT_TRUE(started);
    process_.emplace(std::move(*started));
  }
  Result<std::unique_ptr<StartedExtension>> start(const std::string& identifier, SharedFileDescriptor endpoint = {}) {
    int ends[2];
    if (!endpoint && ::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) == 0) {
      peers_.emplace_back(ends[0]);  // an extension that nobody expects would leave
      endpoint = shareFileDescriptor(FileDescriptor(ends[1]));
    }
    ExtensionRecord extension;
    extension.identifier = identifier;
    return remote_.start(extension, {.requests = endpoint, .auxiliary = endpoint},
                         {.didEnd = [this](int status) { ends_.add(status); }, .willKill = [](const Error&) {}});
  }
  int64_t errorOfStart(const std::string& identifier, SharedFileDescriptor endpoint = {}) {
    const auto started = start(identifier, std::move(endpoint));
    return started ? 0 : started.error().code;
  }
  static FileDescriptor handleOf(const StartedExtension& extension) {
    return FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, extension.processIdentifier(), 0)));
  }
  static bool hasEnded(const FileDescriptor& process) {
    pollfd watched{process.get(), POLLIN, 0};
    return process.isValid() && ::poll(&watched, 1, std::chrono::milliseconds(kit::kNever).count()) == 1;
  }

  RemoteExtensionStarter remote_;
  SharedFileDescriptor listening_;
  std::optional<SpawnedProcess> process_;
  std::vector<FileDescriptor> peers_;
  kit::Events<int> ends_;
};

TEST_F(ExtensionStarterTest, RunsExtensionsConfinedAsReservedUsers) {
  const uid_t user = static_cast<uid_t>(std::stoul(run("user")));
  EXPECT_GE(user, reservedUserRange().first);
  EXPECT_LT(user - reservedUserRange().first, reservedUserRange().count);
  EXPECT_EQ(run("write home", "kept"), "ok");
  EXPECT_TRUE(root_.exists(kUploadContainer + "/kept"));
  EXPECT_TRUE(isRefused("read", root_.write("/private/var/mobile/Media/Movies/old.mp4", "secret")));
  EXPECT_TRUE(isRefused("local socket", ""));
  EXPECT_TRUE(isRefused("fork", ""));
  std::ifstream status("/proc/" + run("process") + "/status");
  const std::string all(std::istreambuf_iterator<char>(status), {});
  EXPECT_NE(all.find("CapBnd:\t0000000000000000"), std::string::npos) << all;
  EXPECT_EQ(begin("crash")->began.next().second, ECONNRESET);
  EXPECT_EQ(run("echo", "anew"), "anew");
}

TEST_F(ExtensionStarterTest, EndsAProcessWithItsConnection) {
  auto started = start(kUpload);
  ASSERT_TRUE(started) << started.error().description();
  const FileDescriptor first = handleOf(**started);
  started->reset();
  EXPECT_TRUE(hasEnded(first));
  ends_.next();

  started = start(kUpload);
  ASSERT_TRUE(started);
  started.value()->kill();
  EXPECT_EQ(ends_.next(), SIGKILL);

  // What the service started goes with it, and the next start finds the next service.
  started = start(kUpload);
  ASSERT_TRUE(started);
  const FileDescriptor last = handleOf(**started);
  process_.reset();
  EXPECT_EQ(ends_.next(), SIGKILL);
  EXPECT_TRUE(hasEnded(last));
  startService();
  EXPECT_EQ(run("echo", "again"), "again");
}

TEST_F(ExtensionStarterTest, StartsOnlyWhatRootInstalledAndOnlyForRoot) {
  EXPECT_EQ(errorOfStart("com.example.nobody"), ENOENT);
  install("/System/Applications/Open", "com.example.open");
  ASSERT_EQ(::chmod(root_.path("/System/Applications/Open/bin").c_str(), 0777), 0);
  EXPECT_EQ(errorOfStart("com.example.open"), EPERM);
  FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  EXPECT_EQ(errorOfStart(kUpload, shareFileDescriptor(std::move(file))), EBADMSG) << "no endpoint";
  install("/elsewhere/Upload", "com.example.elsewhere");
  EXPECT_EQ(errorOfStart("com.example.elsewhere"), ENOENT);

  // Credentials are a thread's where the kernel alone is asked.
  ASSERT_EQ(::chmod(socketOf(root_.path()).c_str(), 0666), 0);
  std::thread([this] {
    ASSERT_EQ(::syscall(SYS_setresuid, kStranger, kStranger, kStranger), 0);
    const int64_t error = errorOfStart(kUpload);
    EXPECT_TRUE(error == ECONNRESET || error == EPIPE) << error;
  }).join();
  EXPECT_EQ(errorOfStart(kUpload), 0);
}

TEST_F(ExtensionStarterTest, TellsWhatTheNetworkReaches) {
  EXPECT_EQ(remoteReachabilityOfHost(socketOf(root_.path()), "127.0.0.1"), reachability::kReachable);
  EXPECT_EQ(remoteReachabilityOfHost(root_ / "nowhere", "127.0.0.1"), std::nullopt);
}

}  // namespace
}  // namespace qv::platform
