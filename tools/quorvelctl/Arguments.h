#pragma once

#include <optional>
#include <string>
#include <vector>

namespace ctl {

/// A command line.
///
/// Threading: a value.
struct Arguments {
  std::string verb;
  bool json = false;
  std::optional<std::string> output;  ///< -o: a file
  std::optional<double> seconds;      ///< of a recording
  bool microphone = false;
  std::optional<std::string> bundle;        ///< an application's identifier
  std::optional<std::pair<int, int>> size;  ///< pixels of the picture
  std::optional<std::string> plot;          ///< a file
  bool look = false;                        ///< and change nothing
  std::vector<std::string> rest;

  /// Throws a Failure for an option that the verb does not have, or that has no good value.
  static Arguments parse(int argc, char** argv);
};

}  // namespace ctl
