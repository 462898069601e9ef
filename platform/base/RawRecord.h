#pragma once

#include <cstring>

#include "platform/base/Value.h"

namespace qv::platform {

/// The raw bytes of a record that crosses to another process of this device.
template <typename Record>
Data rawBytes(const Record& record) {
  Data bytes(sizeof record);
  std::memcpy(bytes.data(), &record, sizeof record);
  return bytes;
}

}  // namespace qv::platform
