#pragma once

#include <string>
#include <string_view>

#include "platform/base/Result.h"
#include "platform/base/Value.h"

namespace qv::platform {

/// Containers nest no deeper in what is read.
inline constexpr int kMaximumJSONDepth = 32;

/// Parses a JSON text (RFC 8259, UTF-8) of at most 1 MiB. Integers become int64 (or uint64 where they
/// fit nothing smaller), other numbers double, null a none value. The later of two equal keys holds.
/// Any input is safe; an error (domain posix, EBADMSG) says what is wrong.
Result<Value> parseJSON(std::string_view text);

/// The dictionary in a small file; EBADMSG where it holds anything else.
Result<Dictionary> readJSONDictionary(const std::string& path);

/// One line of JSON, without line feed. Bytes that are not UTF-8 are replaced; a date becomes seconds
/// since 1970, a URL its text, data an array of numbers, and what JSON cannot say null.
std::string serializeJSON(const Value& value);

}  // namespace qv::platform
