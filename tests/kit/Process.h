#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

#include "platform/process/SpawnedProcess.h"

namespace qv::kit {

/// Whether PATH has a program.
bool isInstalled(const std::string& program);

/// A program that a test started: it reads what the program writes, and ends it with this object. The program gets
/// lines on descriptor 3, which ends when this object does. It has the environment of the test without a display, and
/// `environment` ("NAME=value") besides.
///
/// Threading: one thread.
class Process {
 public:
  explicit Process(std::string program, std::vector<std::string> arguments = {},
                   std::vector<std::string> environment = {});
  [[nodiscard]] pid_t pid() const { return process_->processIdentifier(); }
  bool say(const std::string& line);
  /// Of its standard output: up to the end of a line, without it. Empty when the program has ended.
  std::string readLine();
  /// As many bytes; fewer where the program ended before.
  std::string read(size_t size);
  /// Up to this line; false where it does not come.
  bool awaitLine(const std::string& line);
  /// Waits for it to end by itself; its exit status, or -1.
  int wait();
  /// Returns when it is gone.
  void kill() { process_.reset(); }
  /// As the service manager does it: it may tidy up. Returns when it is gone.
  void stop();

 private:
  platform::FileDescriptor input_, output_;
  std::optional<platform::SpawnedProcess> process_;
};

}  // namespace qv::kit
