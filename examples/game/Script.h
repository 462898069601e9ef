#pragma once

#include <chrono>
#include <optional>
#include <string_view>
#include <vector>

namespace comet {

/// One step of a scripted session, e.g. of "record 4; pause 2; record 4; stop; quit".
struct Step {
  enum class Kind { Record, Pause, Wait, Capture, Stop, Save, Discard, Quit };
  Kind kind = Kind::Wait;
  std::chrono::nanoseconds duration{0};
};

/// Nothing where the text is no script.
std::optional<std::vector<Step>> parseScript(std::string_view text);

}  // namespace comet
