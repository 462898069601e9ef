#include "tools/quorvelctl/ChildOutput.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>

#include "tools/quorvelctl/Failure.h"

namespace ctl {

namespace {

/// One that is told to end by a signal ends: none stays blocked in it.
int spawn(pid_t& child, const std::string& program, const std::vector<std::string>& arguments, int output) {
  posix_spawn_file_actions_t files;
  posix_spawnattr_t attributes;
  ::posix_spawn_file_actions_init(&files);
  ::posix_spawnattr_init(&attributes);
  ::posix_spawn_file_actions_adddup2(&files, output, STDOUT_FILENO);
  ::posix_spawn_file_actions_addopen(&files, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  sigset_t none;
  sigemptyset(&none);
  ::posix_spawnattr_setsigmask(&attributes, &none);
  ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
  std::vector<char*> argv{const_cast<char*>(program.c_str())};
  for (const std::string& argument : arguments) argv.push_back(const_cast<char*>(argument.c_str()));
  argv.push_back(nullptr);
  const int error = ::posix_spawn(&child, program.c_str(), &files, &attributes, argv.data(), environ);
  ::posix_spawnattr_destroy(&attributes);
  ::posix_spawn_file_actions_destroy(&files);
  return error;
}

std::string readAll(int descriptor) {
  std::string all;
  std::array<char, 4096> bytes;
  for (ssize_t count = 1; count != 0;) {
    count = ::read(descriptor, bytes.data(), bytes.size());
    if (count > 0) all.append(bytes.data(), static_cast<size_t>(count));
    if (count < 0 && errno != EINTR) break;
  }
  return all;
}

}  // namespace

std::vector<std::string> textsOf(const std::string& program, const std::vector<std::string>& arguments) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw Failure{Exit::Failed, std::string("no pipe: ") + std::strerror(errno)};
  pid_t child = -1;
  const int error = spawn(child, program, arguments, ends[1]);
  ::close(ends[1]);
  const std::string said = error == 0 ? readAll(ends[0]) : "";
  ::close(ends[0]);
  if (error != 0) {
    throw Failure{Exit::Failed, program + " cannot be started: " + std::strerror(error) + "; install quorveld anew"};
  }
  int status = 0;
  while (::waitpid(child, &status, 0) < 0 && errno == EINTR) {
  }
  std::vector<std::string> texts;
  for (size_t at = 0, end = 0; (end = said.find('\0', at)) != std::string::npos; at = end + 1) {
    texts.push_back(said.substr(at, end - at));
  }
  if (!WIFEXITED(status) || (WEXITSTATUS(status) != 0 && texts.empty())) {
    throw Failure{Exit::Failed, program + " has failed; install quorveld anew"};
  }
  return texts;
}

}  // namespace ctl
