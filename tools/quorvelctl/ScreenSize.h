#pragma once

#include <utility>

namespace ctl {

/// Pixels of the display's screen; those of a television where no display answers.
[[nodiscard]] std::pair<int, int> screenSize();

}  // namespace ctl
