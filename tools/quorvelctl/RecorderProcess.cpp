#include "tools/quorvelctl/RecorderProcess.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <utility>

#include "tools/quorvelctl/Failure.h"

namespace ctl {

namespace {

constexpr const char kInBundles[] = "/Quorvelctl.app/bin/quorvelctl-recorder";

struct Pipe {
  Pipe() {
    if (::pipe2(ends, O_CLOEXEC) != 0) throw Failure{Exit::Failed, std::string("no pipe: ") + std::strerror(errno)};
  }
  int ends[2]{-1, -1};  ///< to read from, to write to
};

/// With no signal blocked, and in a group of its own: what is typed at the terminal comes to this program alone, which
/// hands it on.
int spawn(pid_t& child, const std::string& program, const std::vector<std::string>& arguments, int input, int output) {
  posix_spawn_file_actions_t files;
  posix_spawnattr_t attributes;
  ::posix_spawn_file_actions_init(&files);
  ::posix_spawnattr_init(&attributes);
  ::posix_spawn_file_actions_adddup2(&files, input, STDIN_FILENO);
  ::posix_spawn_file_actions_adddup2(&files, output, STDOUT_FILENO);
  sigset_t none;
  sigemptyset(&none);
  ::posix_spawnattr_setsigmask(&attributes, &none);
  ::posix_spawnattr_setpgroup(&attributes, 0);
  ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETPGROUP);
  std::vector<char*> argv{const_cast<char*>(program.c_str())};
  for (const std::string& argument : arguments) argv.push_back(const_cast<char*>(argument.c_str()));
  argv.push_back(nullptr);
  const int error = ::posix_spawn(&child, program.c_str(), &files, &attributes, argv.data(), environ);
  ::posix_spawnattr_destroy(&attributes);
  ::posix_spawn_file_actions_destroy(&files);
  return error;
}

}  // namespace

/// In the same roots, and in the same order, as the daemon finds bundles.
std::string RecorderProcess::path() {
  const char* root = std::getenv("QUORVEL_DEVICE_ROOT");
  const std::string device = root != nullptr ? root : "";
  std::vector<std::string> roots{device + "/Applications", device + "/System/Applications"};
  const char* further = std::getenv("QUORVEL_BUNDLE_PATH");
  std::istringstream list(further != nullptr ? further : "");
  for (std::string directory; std::getline(list, directory, ':');) roots.push_back(directory);
  for (const std::string& directory : roots) {
    if (::access((directory + kInBundles).c_str(), X_OK) == 0) return directory + kInBundles;
  }
  return {};
}

RecorderProcess::RecorderProcess(const std::vector<std::string>& arguments) {
  const std::string program = path();
  if (program.empty()) {
    throw Failure{Exit::Failed, "Quorvelctl.app, which records, is in no directory of bundles: install it anew"};
  }
  const Pipe life, said;
  const int error = spawn(child_, program, arguments, life.ends[0], said.ends[1]);
  ::close(life.ends[0]);
  ::close(said.ends[1]);
  life_ = life.ends[1];
  said_ = said.ends[0];
  if (error == 0) return;
  ::close(life_);
  ::close(said_);
  throw Failure{Exit::Failed, program + " cannot be started: " + std::strerror(error)};
}

RecorderProcess::~RecorderProcess() {
  ::close(life_);
  ::close(said_);
  while (::waitpid(child_, nullptr, 0) < 0 && errno == EINTR) {
  }
}

std::optional<nlohmann::json> RecorderProcess::next() {
  std::array<char, 4096> bytes;
  while (!hasLine()) {
    const ssize_t count = ::read(said_, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return std::nullopt;
    pending_.append(bytes.data(), static_cast<size_t>(count));
  }
  const size_t end = pending_.find('\n');
  auto said = nlohmann::json::parse(pending_.begin(), pending_.begin() + static_cast<ptrdiff_t>(end), nullptr, false);
  pending_.erase(0, end + 1);
  return said.is_object() ? std::move(said) : nlohmann::json{{"event", "garbled"}};
}

void RecorderProcess::stop() { ::kill(child_, SIGINT); }

}  // namespace ctl
