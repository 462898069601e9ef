#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace qv {

/// The texts of one localization.
///
/// Threading: a value.
struct StringsTable {
  std::map<std::string, std::string, std::less<>> texts;
  /// What is wrong, with its line number, where the table is broken: then `texts` holds every entry
  /// before the fault and none after it.
  std::optional<std::string> fault;
};

/// Larger tables are not read, in bytes.
inline constexpr size_t kMaximumStringsTableSize = 1 << 20;

/// Parses a table: UTF-8, entries of the form "key" = "text"; between // and /* */ comments. In
/// quotes stand the escapes \" \\ \n \t \r and \U or \u with four hexadecimal digits (UTF-16; an
/// unpaired surrogate, or a zero, reads as U+FFFD). Where a key comes twice, the later text holds.
/// Any input is safe.
[[nodiscard]] StringsTable parseStringsTable(std::string_view source);

}  // namespace qv
