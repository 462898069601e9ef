#include "tests/kit/Process.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <sstream>
#include <stdexcept>

namespace qv::kit {
namespace {

struct Pipe {
  Pipe() {
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("pipe");
    forReading.reset(ends[0]);
    forWriting.reset(ends[1]);
  }
  platform::FileDescriptor forReading, forWriting;
};

}  // namespace

bool isInstalled(const std::string& program) {
  std::istringstream directories(std::getenv("PATH"));
  for (std::string directory; std::getline(directories, directory, ':');)
    if (::access((directory + "/" + program).c_str(), X_OK) == 0) return true;
  return false;
}

Process::Process(std::string program, std::vector<std::string> arguments, std::vector<std::string> environment) {
  Pipe lines, output;
  for (char** entry = environ; *entry != nullptr; ++entry)
    if (!std::string(*entry).starts_with("DISPLAY=")) environment.emplace_back(*entry);
  auto started = platform::SpawnedProcess::start({.program = std::move(program),
                                                  .arguments = std::move(arguments),
                                                  .environment = std::move(environment),
                                                  .output = std::move(output.forWriting),
                                                  .descriptors = {shareFileDescriptor(std::move(lines.forReading))}});
  if (!started) throw std::runtime_error("cannot start " + started.error().description());
  process_ = std::move(*started);
  input_ = std::move(lines.forWriting);
  output_ = std::move(output.forReading);
}

bool Process::say(const std::string& line) {
  const std::string text = line + "\n";
  return ::write(input_.get(), text.data(), text.size()) == static_cast<ssize_t>(text.size());
}

std::string Process::read(size_t size) {
  std::string bytes(size, '\0');
  size_t length = 0;
  while (length < size) {
    const ssize_t got = ::read(output_.get(), bytes.data() + length, size - length);
    if (got <= 0) break;
    length += static_cast<size_t>(got);
  }
  bytes.resize(length);
  return bytes;
}

std::string Process::readLine() {
  std::string line;
  for (std::string next = read(1); !next.empty() && next != "\n"; next = read(1)) line += next;
  return line;
}

bool Process::awaitLine(const std::string& line) {
  std::string found;
  do found = readLine();
  while (!found.empty() && found != line);
  return found == line;
}

int Process::wait() {
  const int status = process_->waitForEnd();
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

void Process::stop() {
  process_->sendSignal(SIGTERM);
  wait();
  kill();
}

}  // namespace qv::kit
