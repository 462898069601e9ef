#pragma once

#include <string>

namespace qv {

/// Puts `argument` in place of the format's one "%@".
[[nodiscard]] inline std::string formatted(std::string format, const std::string& argument) {
  const size_t position = format.find("%@");
  if (position != std::string::npos) format.replace(position, 2, argument);
  return format;
}

}  // namespace qv
