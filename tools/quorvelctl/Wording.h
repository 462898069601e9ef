#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace ctl {

/// "1:05", "1:02:03".
[[nodiscard]] std::string clockText(double seconds);
/// "3.4 MB", decimal.
[[nodiscard]] std::string sizeText(uint64_t bytes);
/// The local date and time of seconds since 1970.
[[nodiscard]] std::string dateText(double seconds);
/// At most so many characters (of UTF-8).
[[nodiscard]] std::string cutTo(const std::string& text, size_t characters);
/// As many of the first parts as fit, with two spaces between them; the first in any case, cut.
[[nodiscard]] std::string fitted(const std::vector<std::string>& parts, size_t characters);
/// Nothing that a terminal takes for a command: names come from others.
[[nodiscard]] std::string printable(const std::string& text);

}  // namespace ctl
