#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace qv::platform::sdbus {

/// The beginning of a D-Bus message, which tells how long the message is.
inline constexpr size_t kWireHeaderBytes = 16;

/// How long a message is that begins with these kWireHeaderBytes, all of it; 0 where no message begins so. It may be up
/// to three times 4 GiB.
[[nodiscard]] uint64_t sizeOfWireMessage(std::span<const uint8_t> beginning);

/// What is wrong with the header of a whole message, in a few words; null where nothing is. `descriptors` came with it.
///
/// It is what sd-bus asks of a header, and more: fields that it does not know, types of messages that nobody has
/// defined, and padding that is not zero are refused too. sd-bus drops a message with another header silently, and with
/// it the descriptors, which stay open then. Of the body nothing is looked at but its size.
///
/// Threading: thread-safe.
[[nodiscard]] const char* faultOfWireMessage(std::span<const uint8_t> message, size_t descriptors);

/// Whether these are complete types, one after the other, within the depths that D-Bus allows.
[[nodiscard]] bool isWireSignature(std::span<const uint8_t> signature);

}  // namespace qv::platform::sdbus
