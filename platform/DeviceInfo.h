#pragma once

#include <cstdint>
#include <string_view>

namespace qv::platform {

enum class UserInterfaceIdiom : int32_t { Unspecified = -1, Phone = 0, Tablet = 1, Television = 2 };

/// What the hardware is. Answers come from the device description, one JSON file under the device
/// root; without it the device is a plain television box without microphone.
///
/// Threading: thread-safe.
class DeviceInfoQuery {
 public:
  virtual ~DeviceInfoQuery() = default;
  [[nodiscard]] virtual UserInterfaceIdiom userInterfaceIdiom() = 0;
  /// Properties by name, e.g. "ChipID"; 0 or false where the description lacks them.
  [[nodiscard]] virtual int64_t integerProperty(std::string_view name) = 0;
  [[nodiscard]] virtual bool booleanProperty(std::string_view name) = 0;
  [[nodiscard]] virtual bool hasAudioCaptureDevice() = 0;
  /// Whether internal security policies are allowed for a program (internal builds only).
  [[nodiscard]] virtual bool allowsInternalSecurityPolicies(std::string_view program) = 0;
};

}  // namespace qv::platform
