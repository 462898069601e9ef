// A hostile extension (ExtensionAttacks.cpp) in the real service and launcher. The suite runs as the user that it is
// started as; where that is root, once more as another (AsOrdinaryUser).
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "platform/linux/ExtensionBounds.h"
#include "platform/threads/RunLoop.h"
#include "tests/kit/Process.h"
#include "tests/linux/ExtensionStage.h"

namespace qv::platform {
namespace {

const std::string kSelf = std::filesystem::read_symlink("/proc/self/exe");

/// Threads, files, TLS, sockets and names.
constexpr const char kPythonProgram[] = R"(
import asyncio, os, shutil, socket, ssl, tempfile, threading, time
thread = threading.Thread(target=time.sleep, args=(0.01,))
thread.start()
thread.join()
with tempfile.TemporaryDirectory() as folder:
  open(folder + "/a", "w").write("x")
  shutil.move(folder + "/a", folder + "/b")
  os.statvfs(folder)
ssl.create_default_context()
async def answer(reader, writer):
  writer.write(await reader.read(1))
  writer.close()
async def main():
  server = await asyncio.start_server(answer, "127.0.0.1", 0)
  reader, writer = await asyncio.open_connection(*server.sockets[0].getsockname())
  writer.write(b"x")
  assert await reader.read() == b"x"
asyncio.run(main())
socket.getaddrinfo("localhost", 80)
print("python is well")
)";

bool isRoot() { return ::geteuid() == 0; }

class ExtensionEscapeTest : public ExtensionStage {
 protected:
  std::string log() { return root_.read(kUploadContainer + "/stderr.log"); }
  /// Whether a program that many extensions need runs as one; what it said.
  std::string runProgram(const std::string& command) {
    use_.reset();
    const auto flow = begin("become", command);
    // It may be the other program before its answer has left: then the request never began, but it ends likewise.
    if (flow->began.next().second == 0) flow->completed.next();
    return log();
  }
  const std::string daemon_ = std::to_string(::getpid());
};

TEST_F(ExtensionEscapeTest, FilesOfOthersStayAsTheyAre) {
  const std::string store = "/private/var/mobile/Library/Quorvel";
  const std::string secret = root_.write(store + "/movie.mp4", "secret");
  const std::string inBundle = root_.write(kUploadBundle + "/helper", "#!");
  ::chmod(secret.c_str(), 0600);
  ::chmod(inBundle.c_str(), 0755);
  for (const std::string& path :
       {secret, inBundle, root_.path(store), root_.path(kUploadBundle), std::string("/usr")}) {
    struct stat before {
    }, after{};
    ASSERT_EQ(::stat(path.c_str(), &before), 0);
    for (const std::string attack : {"mode", "plain mode", "mode through descriptor", "owner", "times", "attribute"}) {
      EXPECT_TRUE(isRefused(attack, path));
    }
    ASSERT_EQ(::stat(path.c_str(), &after), 0);
    EXPECT_EQ(after.st_mode, before.st_mode) << path;
    EXPECT_EQ(after.st_uid, before.st_uid) << path;
    EXPECT_EQ(after.st_mtim.tv_nsec, before.st_mtim.tv_nsec) << path;
  }
  EXPECT_TRUE(isRefused("set-id file"));
  for (const std::string& directory : {root_.path("/Applications"), std::string("/tmp"), std::string("/dev/shm")}) {
    EXPECT_TRUE(isRefused("make", directory + "/left-by-an-extension"));
  }
}

TEST_F(ExtensionEscapeTest, OtherProcessesDoNotFeelIt) {
  rlimit before{}, after{};
  ::getrlimit(RLIMIT_FSIZE, &before);
  for (const std::string attack : {"limit", "affinity", "priority", "signal", "signal by pipe", "trace", "memory of"}) {
    EXPECT_TRUE(isRefused(attack, daemon_));
  }
  ::getrlimit(RLIMIT_FSIZE, &after);
  EXPECT_EQ(after.rlim_cur, before.rlim_cur);
  if (!isRoot()) {
    EXPECT_TRUE(isRefused("all priorities", std::to_string(::getuid())));
  }
  for (const std::string attack :
       {"clear death signal", "hide from trace", "message queue", "semaphores", "shared memory", "posix queue",
        "memory file", "user namespace", "io_uring", "datagram pair", "packet route", "local socket", "fork"}) {
    EXPECT_TRUE(isRefused(attack));
  }
}

TEST_F(ExtensionEscapeTest, TakesNoMoreThanItsBounds) {
  EXPECT_EQ(run("too large file"), "errno " + std::to_string(EFBIG));
  if (extensionbounds::kAddressSpace != RLIM_INFINITY) {
    EXPECT_LT(std::stoull(run("memory")), extensionbounds::kAddressSpace >> 20);
  }
  use_.reset();
  EXPECT_EQ(run("flood errors", "3"), "ok");
  const auto size = std::filesystem::file_size(root_.path(kUploadContainer + "/stderr.log"));
  EXPECT_LE(size, extensionbounds::kLogSize);
  const auto crash = begin("crash");
  EXPECT_EQ(crash->began.next().second, ECONNRESET);
  EXPECT_NE(log().find("\n3071xxx"), std::string::npos) << "the last line";
  EXPECT_LE(log().size(), extensionbounds::kLogSize);
}

TEST_F(ExtensionEscapeTest, HasFewThreads) {
  if (!isRoot()) GTEST_SKIP() << "threads are counted by user";
  const int made = std::stoi(run("threads"));
  EXPECT_GT(made, 16);
  EXPECT_LE(made, static_cast<int>(extensionbounds::kThreads));
}

TEST_F(ExtensionEscapeTest, EndsWhenItsContainerIsFull) {
  if (std::filesystem::space(root_.path()).available < 4 * extensionbounds::kContainerBytes) {
    GTEST_SKIP() << "the disk is small";
  }
  for (const std::string attack : {"fill unnamed", "fill"}) {
    const auto held = begin("hold");
    ASSERT_EQ(held->began.next().second, 0);
    EXPECT_EQ(run(attack, "640"), "ok") << attack;
    EXPECT_EQ(held->completed.next(), failure(EDQUOT)) << attack;
  }
  // It may tidy up.
  EXPECT_EQ(run("echo", "again"), "again");
}

TEST_F(ExtensionEscapeTest, EachHasAUserAndAContainerOfItsOwn) {
  if (!isRoot()) GTEST_SKIP() << "the daemon is not root";
  install("/System/Applications/Other", "com.example.other");
  const std::string left = root_.write("/private/var/mobile/Containers/com.example.other/left", "of a former daemon");
  const auto other = service_.useExtension(find().at(1));
  const std::string user = run("user"), anotherUser = beginOn(*other, "user")->completed.next();
  EXPECT_NE(user, "0");
  EXPECT_NE(user, anotherUser);
  struct stat info {};
  ASSERT_EQ(::stat(root_.path(kUploadContainer).c_str(), &info), 0);
  EXPECT_EQ(std::to_string(info.st_uid), user);
  EXPECT_EQ(info.st_mode & 07777, 0700u);
  ASSERT_EQ(::stat(left.c_str(), &info), 0);
  EXPECT_EQ(std::to_string(info.st_uid), anotherUser);
  EXPECT_TRUE(isRefused("read", left));
}

/// What the filter must let through.
TEST_F(ExtensionEscapeTest, RunsRealPrograms) {
  EXPECT_NE(runProgram("exec /usr/bin/python3 -c '" + std::string(kPythonProgram) + "'").find("python is well"),
            std::string::npos)
      << log();
  EXPECT_NE(runProgram("exec curl -sS http://localhost:1/").find("curl: (7)"), std::string::npos) << log();
  runProgram(
      "exec ffmpeg -y -nostdin -f lavfi -i testsrc=duration=1:size=320x240 -f lavfi -i sine=duration=1 -c:v libx264 "
      "-c:a aac $HOME/made.mp4");
  EXPECT_NE(log().find("kb/s:"), std::string::npos) << log();
  EXPECT_GT(std::filesystem::file_size(root_.path(kUploadContainer + "/made.mp4")), 1000u);
}

/// The daemon of the test below, in a process of its own: a hostile extension loses its parent-death signal, by the
/// exec of a thread.
TEST_F(ExtensionEscapeTest, DISABLED_DaemonThatIsKilled) {
  const int watch = ::inotify_init1(IN_CLOEXEC);
  const std::string process = run("process");
  ASSERT_GE(::inotify_add_watch(watch, root_.path(kUploadContainer + "/stderr.log").c_str(), IN_MODIFY), 0);
  // It may be another program before it has answered.
  const auto flow = begin("become in thread", "echo alive >&2; exec sleep 1000");
  char event[sizeof(inotify_event) + NAME_MAX + 1];
  ASSERT_GT(::read(watch, event, sizeof event), 0);
  std::printf("\nextension %s in %s\n", process.c_str(), root_.path().c_str());
  std::fflush(stdout);
  ::pause();
}

TEST_F(ExtensionEscapeTest, DoesNotOutliveTheDaemon) {
  kit::Process daemon(kSelf, {"--gtest_also_run_disabled_tests", "--gtest_filter=*.DISABLED_DaemonThatIsKilled"});
  int process = 0;
  char folder[256] = {};
  std::string line;
  do {
    line = daemon.readLine();
  } while (std::sscanf(line.c_str(), "extension %d in %255s", &process, folder) != 2 &&
           line.find("FAILED") == std::string::npos);
  ASSERT_GT(process, 0) << line;
  const FileDescriptor handle(static_cast<int>(::syscall(SYS_pidfd_open, process, 0)));
  ASSERT_TRUE(handle.isValid());
  pollfd end{handle.get(), POLLIN, 0};
  EXPECT_EQ(::poll(&end, 1, 0), 0) << "it is alive";
  daemon.kill();
  EXPECT_EQ(::poll(&end, 1, std::chrono::milliseconds(kit::kNever).count()), 1);
  std::filesystem::remove_all(folder);
}

TEST(ExtensionEscape, AsOrdinaryUser) {
  if (!isRoot()) GTEST_SKIP() << "the suite is run by one";
  if (!kit::isInstalled("setpriv")) GTEST_SKIP() << "setpriv is not installed";
  const auto asOther = [](std::vector<std::string> command) {
    command.insert(command.begin(), {"--reuid=65534", "--regid=65534", "--clear-groups"});
    return command;
  };
  if (kit::Process("setpriv", asOther({"test", "-x", kSelf})).wait() != 0)
    GTEST_SKIP() << "an ordinary user cannot reach " << kSelf;
  kit::Process suite("setpriv", asOther({kSelf, "--gtest_filter=ExtensionEscapeTest.*"}));
  // That it left tests out would be taken for this one's being left out.
  std::string report = suite.read(1 << 20);
  for (size_t at = 0; (at = report.find("SKIPPED", at)) != std::string::npos;) report.replace(at, 7, "not run");
  EXPECT_EQ(suite.wait(), 0) << report;
}

/// Where somebody has limited it all the same.
TEST(DaemonLimits, AFileThatIsTooLargeIsAFailedWrite) {
  const auto write = [] {
    blockTerminationSignals();
    const rlimit small{1, 1};
    const int file = ::memfd_create("file", MFD_CLOEXEC);
    ::setrlimit(RLIMIT_FSIZE, &small);
    ::_exit(::pwrite(file, "x", 1, 4096) < 0 && errno == EFBIG ? 0 : 1);
  };
  ::testing::FLAGS_gtest_death_test_style = "threadsafe";
  EXPECT_EXIT(write(), ::testing::ExitedWithCode(0), "");
}

}  // namespace
}  // namespace qv::platform
