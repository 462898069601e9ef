#pragma once

#include <string>
#include <vector>

namespace ctl {

/// One thing that doctor looks at.
///
/// Threading: a value.
struct Finding {
  enum class State { Fine, Fault, Unknown };
  std::string check;
  State state = State::Fine;
  std::string text;         ///< what was found
  std::string advice = {};  ///< of a fault: what to do
};

/// What can be seen without the daemon: its socket, the program that records, the kernel.
[[nodiscard]] std::vector<Finding> checkSystem();
/// What the daemon tells: display, sound, encoder, store, space, rights, texts, whom it runs as.
[[nodiscard]] std::vector<Finding> checkDaemon();

}  // namespace ctl
