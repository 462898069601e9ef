#pragma once

#include <span>
#include <string_view>

#include "platform/base/Result.h"
#include "platform/base/Value.h"

namespace qv::platform {

/// Writes an object of a named class, as a dictionary of its keyed fields, into bytes.
///
/// Layout, little-endian: "QVKA", u8 version 1, class name as string, dictionary. A string is u32
/// length and bytes; a dictionary u32 count and (string, value) pairs; a value one type byte and
/// its content: n none, b u8, i/u 32-bit, x/t 64-bit, d IEEE double, s string, y u32 length and
/// bytes, a u32 count and values, m dictionary, D double, U string. Descriptors are not archived.
Data encodeKeyedArchive(std::string_view className, const Dictionary& fields);

/// Reads an archive back. Fails for bytes that are no archive, for another class at the root, for
/// nesting beyond 16 and for counts that the bytes cannot hold: it never allocates more than a
/// small multiple of the input.
Result<Dictionary> decodeKeyedArchive(std::span<const uint8_t> bytes, std::string_view expectedClass);

}  // namespace qv::platform
