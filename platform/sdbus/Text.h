#pragma once

#include <string>
#include <string_view>

namespace qv::platform::sdbus {

/// `text` as it may stand in a D-Bus string: each NUL and each byte that is not part of valid UTF-8
/// is replaced by U+FFFD, so that a peer does not drop us for a text that somebody else gave us.
std::string validText(std::string_view text);

}  // namespace qv::platform::sdbus
