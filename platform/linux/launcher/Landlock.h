#pragma once

#include <string>

namespace qv::platform::launcher {

/// The version of the kernel's Landlock interface; 0 where it has none, or where it is switched off.
[[nodiscard]] int landlockVersion();

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
