#pragma once

#include <cstring>
#include <optional>
#include <type_traits>

#include "platform/base/Value.h"

namespace qv::platform {

/// The raw bytes of a record that crosses to another process of this device.
template <typename Record>
Data rawBytes(const Record& record) {
  Data bytes(sizeof record);
  std::memcpy(bytes.data(), &record, sizeof record);
  return bytes;
}

/// The record in `bytes`; nothing where the length is another.
template <typename Record>
std::optional<Record> recordFromBytes(const Data& bytes) {
  static_assert(std::is_trivially_copyable_v<Record>);
  if (bytes.size() != sizeof(Record)) return std::nullopt;
  Record record;
  std::memcpy(&record, bytes.data(), sizeof(Record));
  return record;
}

}  // namespace qv::platform
