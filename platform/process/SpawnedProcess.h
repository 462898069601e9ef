#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform {

/// What is to run, and with what. Nothing else is inherited.
struct SpawnRequest {
  std::string program;                   ///< a path, or a name that is looked for in PATH
  std::vector<std::string> arguments;    ///< after the program's name
  std::vector<std::string> environment;  ///< "NAME=value"
  FileDescriptor output;                 ///< standard output, dropped without; the input is empty
  bool joinsErrors = false;              ///< whether standard error goes there as well; it is dropped otherwise
  /// These become the descriptors 3, 4, ...
  std::vector<SharedFileDescriptor> descriptors;
};

/// A child process in a session of its own, so that a terminal's interrupt does not reach it. Destroying it kills the
/// program where it still runs, and waits for its end. The process id stays taken until then: it can belong to nobody
/// else.
///
/// Threading: used by one thread at a time; `sendSignal` by any, as long as the object lives.
class SpawnedProcess {
 public:
  /// What the request inherits to the program is closed here when this returns.
  static Result<SpawnedProcess> start(SpawnRequest request);
  SpawnedProcess() = default;
  SpawnedProcess(SpawnedProcess&&) noexcept = default;
  /// Only into one that has nothing to end.
  SpawnedProcess& operator=(SpawnedProcess&&) noexcept = default;
  ~SpawnedProcess();

  [[nodiscard]] pid_t processIdentifier() const { return processIdentifier_; }
  /// Readable when the program has ended.
  [[nodiscard]] int handle() const { return handle_.get(); }
  /// Without a program it does nothing.
  void sendSignal(int signal) const;
  /// Waits for the program's end, and leaves its process id taken; the status as of waitpid.
  [[nodiscard]] int waitForEnd() const;

 private:
  pid_t processIdentifier_ = 0;
  FileDescriptor handle_;  ///< pidfd
};

}  // namespace qv::platform
