#pragma once

#include <sys/types.h>

#include <functional>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Result.h"

namespace qv::platform {

/// What is to run, and with what. Nothing else is inherited.
struct LaunchRequest {
  std::string program;
  std::vector<std::string> arguments;    ///< after the program's name
  std::vector<std::string> environment;  ///< "NAME=value"
  FileDescriptor output;                 ///< standard output and standard error; the input is empty
  /// These become the descriptors 3, 4, ...
  std::vector<SharedFileDescriptor> descriptors;
};

/// A child process in a session of its own, with a thread that waits for its end.
///
/// That thread has also made the process, since PR_SET_PDEATHSIG looks at the death of the parent's thread. The process
/// id stays taken until this object goes: until then it can belong to nobody else.
///
/// Threading: thread-safe; destroy it from another thread than the one `didEnd` comes on.
class LaunchedProcess {
 public:
  /// `didEnd` gets the status as of waitpid, once, on the waiting thread.
  static Result<std::unique_ptr<LaunchedProcess>> start(LaunchRequest request, std::function<void(int)> didEnd);
  /// Kills the process where it still runs, and waits for its end.
  ~LaunchedProcess();
  LaunchedProcess(const LaunchedProcess&) = delete;
  LaunchedProcess& operator=(const LaunchedProcess&) = delete;

  [[nodiscard]] pid_t processIdentifier() const { return processIdentifier_; }
  void sendSignal(int signal) const;

 private:
  LaunchedProcess() = default;
  int spawn(LaunchRequest request);
  void run(LaunchRequest request, std::promise<int> started, const std::function<void(int)>& didEnd);

  pid_t processIdentifier_ = 0;
  FileDescriptor processHandle_;
  std::thread thread_;
};

}  // namespace qv::platform
