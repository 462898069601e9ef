#pragma once

#include <string>

namespace qv::platform::launcher {

/// The version of the kernel's Landlock interface; 0 where it has none, or where it is switched off.
[[nodiscard]] int landlockVersion();

/// From this version on Landlock alone confines a process of the daemon's own user: it then also covers the changing
/// of a file's length (3), device controls (5), and signals and abstract sockets (6, Linux 6.12).
inline constexpr int kCompleteLandlockVersion = 6;

/// The directories and files that an extension may use, as a Landlock domain. Everything else of the file system is
/// closed to the process, and to all that it executes, once it has entered.
///
/// Threading: the launcher has one thread.
class Landlock {
 public:
  /// Opens the paths; those of the system that are missing are left out. Throws std::system_error.
  Landlock(const std::string& bundle, const std::string& container);
  ~Landlock();
  Landlock(const Landlock&) = delete;
  Landlock& operator=(const Landlock&) = delete;

  /// For good. Needs "no new privileges". Throws std::system_error.
  void enter();

 private:
  void allow(const std::string& path, uint64_t access, bool isRequired);

  uint64_t handled_ = 0;
  int ruleset_ = -1;
};

}  // namespace qv::platform::launcher
