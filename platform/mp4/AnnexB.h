#pragma once

#include <cstdint>
#include <span>
#include <vector>

namespace qv::platform::mp4 {

/// The units of an H.264 byte stream, without their start codes.
std::vector<std::span<const uint8_t>> splitByteStream(std::span<const uint8_t> stream);
/// The same units as a movie holds them: each after its length in four bytes. Parameter sets and
/// delimiters, which a movie keeps in its header, are left out.
std::vector<uint8_t> lengthPrefixed(std::span<const uint8_t> stream);
/// The decoder configuration for a byte stream with parameter sets; empty when they are missing.
std::vector<uint8_t> makeAVCConfiguration(std::span<const uint8_t> stream);

}  // namespace qv::platform::mp4
