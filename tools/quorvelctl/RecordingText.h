#pragma once

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

namespace ctl {

/// What is told of a recording, the most important first: "recording 1:05", "3.4 MB", ...
[[nodiscard]] std::vector<std::string> partsOf(const nlohmann::json& recording);
/// The same of all of them, in one line of so many characters.
[[nodiscard]] std::string lineOf(const nlohmann::json& recordings, size_t characters);

}  // namespace ctl
