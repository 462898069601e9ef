#pragma once

#include <nlohmann/json.hpp>
#include <string>

namespace ctl {

/// A picture of these events, the oldest at the left, as SVG: the pictures a second of each recording beside those that
/// were asked for, the pictures that were dropped, and the size of its file.
[[nodiscard]] std::string plotOf(const nlohmann::json& events);

}  // namespace ctl
