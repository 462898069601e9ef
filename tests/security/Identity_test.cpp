#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/wait.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <optional>
#include <string>

#include "platform/base/Value.h"
#include "platform/process/SpawnedProcess.h"
#include "tests/kit/Process.h"
#include "tests/security/ByHand.h"
#include "tests/security/DaemonRoot.h"

namespace qv {
namespace {

namespace fs = std::filesystem;
using platform::FileDescriptor;
using namespace std::string_literals;

constexpr const char kRemote[] = "com.example.remote";
constexpr const char kOurs[] = "1001";
constexpr const char kTheirs[] = "1002";
constexpr const char kNoEntitlement[] = "-5810";

/// A daemon of its own, and an application that is entitled to record the screen. Who is somebody else is another user,
/// or another program.
class IdentityAttack : public testing::Test {
 protected:
  IdentityAttack() {
    root_.write("/Applications/Remote/Info.json",
                R"({"CFBundleIdentifier": "com.example.remote", "CFBundleDisplayName": "Remote"})");
    remote_ = install("/Applications/Remote/bin/remote");
    elsewhere_ = install("/elsewhere");
    startDaemon();
  }
  std::string install(const std::string& path) const {
    fs::create_directories(fs::path(root_.path(path)).parent_path());
    fs::copy_file(SECURITY_CLIENT, root_.path(path));
    return root_.path(path);
  }
  void entitle(const std::string& users) {
    root_.write("/etc/quorvel/entitlements/"s + kRemote + ".json",
                R"({"com.tarnwick.private.quorvel": true, "users": [)" + users + "]}");
  }
  /// It is given its socket, as a service manager does it: whoever connects before it is ready waits.
  void startDaemon() {
    FileDescriptor listening(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const int isOn = 1;
    ::setsockopt(listening.get(), SOL_SOCKET, SO_PASSCRED, &isOn, sizeof isOn);
    const sockaddr_un address = security::addressOf(socket_);
    ASSERT_EQ(::bind(listening.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(listening.get(), 16), 0);
    fs::permissions(socket_, fs::perms(0666));
    platform::SpawnRequest request{
        .program = "/bin/sh",
        .arguments = {"-c", "export LISTEN_PID=$$ LISTEN_FDS=1; exec \"$0\"", DAEMON},
        .environment = {"QUORVEL_DEVICE_ROOT=" + root_.path(), "XDG_RUNTIME_DIR=" + root_.path(),
                        "PULSE_SERVER=unix:" + root_.path("/none"), "LC_ALL=C.UTF-8", "PATH=/usr/bin:/bin"},
        .output = {},
        .descriptors = {shareFileDescriptor(std::move(listening))}};
    for (const char* name : {"ASAN_OPTIONS", "LSAN_OPTIONS", "UBSAN_OPTIONS", "TSAN_OPTIONS"}) {
      if (const char* value = std::getenv(name)) request.environment.push_back(std::string(name) + "=" + value);
    }
    auto started = platform::SpawnedProcess::start(std::move(request));
    ASSERT_TRUE(started);
    daemon_.emplace(std::move(*started));
  }
  ~IdentityAttack() override {
    if (!daemon_) return;
    daemon_->sendSignal(SIGTERM);
    EXPECT_EQ(daemon_->waitForEnd(), 0) << "the daemon has come to no harm";
  }

  /// Until it is sent SIGCONT.
  void holdDaemon() {
    daemon_->sendSignal(SIGSTOP);
    siginfo_t stopped{};
    ASSERT_EQ(::waitid(P_PID, static_cast<id_t>(daemon_->processIdentifier()), &stopped, WSTOPPED | WNOWAIT), 0);
  }

  /// A process that does what it is told.
  class Client {
   public:
    Client(const IdentityAttack& on, const std::string& program, const char* user = nullptr)
        : process_(program, {on.socket_}) {
      EXPECT_TRUE(process_.awaitLine("runs"));
      if (user == nullptr) return;
      EXPECT_EQ(ask("user "s + user), "ok");
    }
    std::string ask(const std::string& command) {
      process_.say(command);
      return process_.readLine();
    }
    /// With its connection.
    void become(const std::string& program) {
      process_.say("become " + program);
      EXPECT_TRUE(process_.awaitLine("runs"));
    }

   private:
    kit::Process process_;
  };

  /// The URL of a system recording's movie. One that is stopped before its first picture has none.
  static std::string recordMovie(Client& client) {
    std::string movie;
    while (!movie.starts_with("file:///") && !HasFailure()) {
      EXPECT_EQ(client.ask("start system"), "ok");
      movie = client.ask("stop");
    }
    return movie;
  }

  security::DaemonRoot root_;
  const std::string socket_ = root_.path("/com.tarnwick.quorveld");
  std::string remote_, elsewhere_;
  std::optional<platform::SpawnedProcess> daemon_;
};

/// Between users.
class UserAttack : public IdentityAttack {
 protected:
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "to be another user takes root";
  }
};

TEST_F(UserAttack, ARunningApplicationCannotBeTakenOver) {
  entitle(kOurs);
  Client ours(*this, remote_, kOurs);
  EXPECT_EQ(ours.ask("connect"), "ok");
  EXPECT_EQ(ours.ask("start system"), "ok");
  Client theirs(*this, remote_, kTheirs);
  EXPECT_EQ(theirs.ask("connect"), "closed");
  EXPECT_EQ(theirs.ask("stop"), "closed");
  const std::string answer = ours.ask("stop");
  EXPECT_NE(answer, "closed");
  EXPECT_NE(answer, "refused") << "it was still recording";
  EXPECT_TRUE(fs::exists(platform::URL(recordMovie(ours)).path()));
}

TEST_F(UserAttack, AnEntitlementOfAnotherUserIsNone) {
  entitle(kOurs);
  {
    Client theirs(*this, remote_, kTheirs);
    EXPECT_EQ(theirs.ask("connect"), "ok");
    EXPECT_EQ(theirs.ask("start system"), kNoEntitlement);
    EXPECT_EQ(theirs.ask("start"), "ok") << "an application all the same";
  }
  {
    // What the daemon finds when it looks is the entitled program.
    Client thief(*this, elsewhere_);
    holdDaemon();
    EXPECT_EQ(thief.ask("lend "s + kTheirs + " " + remote_), "ok");
    daemon_->sendSignal(SIGCONT);
    EXPECT_EQ(thief.ask("answer"), kNoEntitlement);
  }
  Client ours(*this, remote_, kOurs);
  while (ours.ask("connect") != "ok") {
  }
  EXPECT_EQ(ours.ask("start system"), "ok");
}

TEST_F(IdentityAttack, AProgramThatComesAfterTheEntitledOneIsAStranger) {
  entitle("\"session\"");
  Client honest(*this, remote_);
  EXPECT_EQ(honest.ask("connect"), "ok");
  recordMovie(honest);
  honest.become(elsewhere_);
  EXPECT_EQ(honest.ask("start system"), kNoEntitlement);
  EXPECT_EQ(honest.ask("start"), "closed");
}

}  // namespace
}  // namespace qv
