#pragma once

#include <optional>
#include <string>

namespace qv::platform::appstream {

/// Bytes of UTF-8 that a text from the catalogue may have.
inline constexpr size_t kLongestText = 256;

/// A text from the catalogue as it may be shown: without control characters and marks that turn the
/// writing direction, no line breaks, cut to `kLongestText` bytes between two characters. Nothing where nothing
/// is left, and for what is no UTF-8. Markup is not interpreted by anybody here, and stays as it is.
std::optional<std::string> presentableText(const char* text);

}  // namespace qv::platform::appstream
