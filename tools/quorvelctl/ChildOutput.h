#pragma once

#include <string>
#include <vector>

namespace ctl {

/// Runs a program to its end; what it printed, cut at each NUL. What it complains of is not shown. Throws a Failure
/// where it cannot be started, or dies.
[[nodiscard]] std::vector<std::string> textsOf(const std::string& program, const std::vector<std::string>& arguments);

}  // namespace ctl
