#pragma once

#include <mutex>
#include <string>

#include "platform/DeviceInfo.h"
#include "platform/base/Value.h"

namespace qv::platform {

/// What the hardware is, from <device root>/etc/quorvel/device.json:
///
///   idiom                         "television", "tablet" or "phone"
///   chipID                        integer; the property "ChipID"
///   audioCaptureDevice            bool
///   internalBuild                 bool; allows internal security policies, for every program
///   RegionalBehaviorShutterClick  bool; and any further property, integer or bool, by its name
///
/// Read once, at the first query. An entry of the wrong type is logged and left out. Without the file,
/// or with a broken one, the device is a plain television box without microphone.
///
/// Threading: thread-safe; the first query blocks.
class DeviceDescription final : public DeviceInfoQuery {
 public:
  explicit DeviceDescription(const std::string& deviceRoot);
  [[nodiscard]] UserInterfaceIdiom userInterfaceIdiom() override;
  [[nodiscard]] int64_t integerProperty(std::string_view name) override;
  [[nodiscard]] bool booleanProperty(std::string_view name) override;
  [[nodiscard]] bool hasAudioCaptureDevice() override;
  [[nodiscard]] bool allowsInternalSecurityPolicies(std::string_view program) override;

 private:
  const Dictionary& description();
  void load();

  const std::string path_;
  std::once_flag loaded_;
  Dictionary description_;
};

}  // namespace qv::platform
