#pragma once

#include <string>
#include <utility>

namespace ctl {

/// How the program ends; the man page has them.
enum class Exit : int {
  Success = 0,
  Failed = 1,       ///< what was asked for could not be done; of doctor: something is wrong
  Usage = 2,        ///< the command line
  NoDaemon = 3,     ///< it cannot be reached
  Refused = 4,      ///< the daemon said no
  DaemonLost = 5,   ///< it went away meanwhile
  NotWritable = 6,  ///< the output
};

/// Ends the program, with one line that says what to do. Thrown: only `main` catches it.
///
/// Threading: a value.
struct Failure {
  Exit code;
  std::string text;
};

}  // namespace ctl
