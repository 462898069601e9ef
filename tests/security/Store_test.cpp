#include <gtest/gtest.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <optional>
#include <string>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Value.h"
#include "tests/kit/Process.h"
#include "tests/security/DaemonRoot.h"

namespace qv {
namespace {

namespace fs = std::filesystem;
using namespace std::string_literals;

const std::string kDenied = std::to_string(EACCES);
constexpr const char kNotTheirs[] = "-5812";
constexpr const char kStore[] = "/private/var/mobile/Library/Quorvel";
/// In which all users of the session are, and nobody else.
constexpr const char kSocketGroup[] = "4710";

/// Says when a file of a directory was written.
class DirectoryWatch {
 public:
  explicit DirectoryWatch(const std::string& path) : inotify_(::inotify_init1(IN_CLOEXEC)) {
    EXPECT_GE(::inotify_add_watch(inotify_.get(), path.c_str(), IN_MODIFY), 0);
  }
  /// Its name; empty after a time that only a fault reaches.
  std::string nextWritten() {
    pollfd event{inotify_.get(), POLLIN, 0};
    alignas(inotify_event) char bytes[4096];
    if (::poll(&event, 1, 60'000) != 1 || ::read(inotify_.get(), bytes, sizeof bytes) <= 0) return {};
    return reinterpret_cast<const inotify_event*>(bytes)->name;
  }

 private:
  const platform::FileDescriptor inotify_;
};

/// A daemon of root over a store that a former version made for all to read, and applications of other users.
class StoreAttack : public testing::Test {
 protected:
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "to be another user takes root";
    if (!kit::isInstalled("setpriv")) GTEST_SKIP() << "there is no setpriv";
    root_.write(kStore + "/left over"s, "of a former version");
    daemon_.emplace(
        DAEMON, std::vector<std::string>{},
        std::vector<std::string>{"QUORVEL_DEVICE_ROOT=" + root_.path(), "XDG_RUNTIME_DIR=" + root_.path(),
                                 "QUORVEL_SOCKET_GROUP="s + kSocketGroup, "PULSE_SERVER=unix:" + root_.path("/none")});
  }
  void TearDown() override {
    if (daemon_) daemon_->stop();
  }

  /// An application of that name, as it is run by this user. It is connected.
  class Application {
   public:
    Application(const StoreAttack& on, const std::string& name, const std::string& user)
        : process_("setpriv", {"--reuid", user, "--regid", kSocketGroup, "--clear-groups", on.install(name)},
                   {"XDG_RUNTIME_DIR=" + on.root_.path()}) {
      EXPECT_TRUE(process_.awaitLine("connected"));
    }
    std::string ask(const std::string& command) {
      process_.say(command);
      return process_.readLine();
    }

   private:
    kit::Process process_;
  };
  [[nodiscard]] std::string install(const std::string& name) const {
    const std::string bundle = "/Applications/" + name;
    root_.write(bundle + "/Info.json",
                R"({"CFBundleIdentifier": "com.example.)" + name + R"(", "CFBundleDisplayName": ")" + name + "\"}");
    fs::create_directories(root_.path(bundle + "/bin"));
    fs::copy_file(MOVIE_CLIENT, root_.path(bundle + "/bin/" + name));
    return root_.path(bundle + "/bin/" + name);
  }
  /// Of a recording that has just written something: the file's path.
  std::string record(Application& application) {
    DirectoryWatch watch(root_.path(kStore));
    EXPECT_EQ(application.ask("start"), "ok");
    return root_.path(kStore) + "/" + watch.nextWritten();
  }
  static unsigned modeOf(const std::string& path) {
    struct stat info {};
    EXPECT_EQ(::stat(path.c_str(), &info), 0) << path;
    return info.st_mode & 07777;
  }

  const security::DaemonRoot root_;
  std::optional<kit::Process> daemon_;
};

TEST_F(StoreAttack, NobodyButTheDaemonReadsAMovieByItsPath) {
  Application owner(*this, "owner", "4711");
  Application stranger(*this, "stranger", "4712");
  EXPECT_EQ(modeOf(root_.path(kStore)), 0700u);
  EXPECT_EQ(modeOf(root_.path(kStore) + "/left over"), 0600u);
  EXPECT_EQ(stranger.ask("read " + root_.path(kStore) + "/left over"), kDenied);

  const std::string path = record(owner);
  EXPECT_EQ(modeOf(path), 0600u) << path;
  for (Application* each : {&owner, &stranger}) {
    EXPECT_EQ(each->ask("read " + path), kDenied);
    EXPECT_EQ(each->ask("read " + root_.path(kStore)), kDenied);
  }
  EXPECT_EQ(platform::URL(owner.ask("stop")).path(), path);
  EXPECT_EQ(modeOf(path), 0600u);
  EXPECT_EQ(stranger.ask("read " + path), kDenied);
}

TEST_F(StoreAttack, AnApplicationOfAnotherUserReadsItsOwnMovieAndNobodyElses) {
  Application owner(*this, "owner", "4711");
  Application stranger(*this, "stranger", "4712");
  const std::string path = record(owner);
  const std::string url = platform::URL::fileURL(path).absoluteString();
  EXPECT_EQ(owner.ask("open " + url), kNotTheirs) << "it is still recorded";
  ASSERT_EQ(owner.ask("stop"), url);
  EXPECT_EQ(owner.ask("open " + url), "movie=1 bytes=" + std::to_string(fs::file_size(path)) +
                                          " write=" + std::to_string(EBADF) + " reopen=" + kDenied);
  EXPECT_EQ(stranger.ask("open " + url), kNotTheirs);
  EXPECT_EQ(owner.ask("discard"), "ok");
  EXPECT_EQ(owner.ask("open " + url), kNotTheirs);
}

}  // namespace
}  // namespace qv
