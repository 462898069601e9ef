#pragma once

#include <string>

namespace qv {

/// The framework's text for `key` in the user's language; the key itself where there is none.
///
/// Threading: thread-safe, blocking (small files).
[[nodiscard]] std::string localizedText(const char* key);

/// Puts `argument` in place of the format's one "%@".
[[nodiscard]] std::string formatted(std::string format, const std::string& argument);

}  // namespace qv
