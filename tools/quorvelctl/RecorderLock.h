#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

namespace ctl {

/// Held by the one program of this user that records. Its file has the process's number, for whoever is to stop it.
///
/// Threading: one thread.
class RecorderLock {
 public:
  /// Takes it; nothing where another process has it.
  static std::optional<RecorderLock> take();
  /// Who has it now; nothing where nobody has.
  static std::optional<pid_t> holder();
  /// Waits until nobody has it.
  static void awaitRelease();

  RecorderLock(RecorderLock&& other) noexcept;
  RecorderLock& operator=(RecorderLock&&) = delete;
  ~RecorderLock();

 private:
  explicit RecorderLock(int file) : file_(file) {}
  static int open();

  int file_;
};

}  // namespace ctl
