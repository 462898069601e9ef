#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "platform/DeviceInfo.h"

namespace qv::fakes {

/// A device that is what its public fields say; as it comes, a plain television box.
///
/// Threading: set it up before it is shared.
class FakeDeviceInfo final : public platform::DeviceInfoQuery {
 public:
  platform::UserInterfaceIdiom idiom = platform::UserInterfaceIdiom::Television;
  std::map<std::string, int64_t, std::less<>> integers;
  std::map<std::string, bool, std::less<>> booleans;
  bool audioCaptureDevice = false;
  bool internalBuild = false;

  platform::UserInterfaceIdiom userInterfaceIdiom() override { return idiom; }
  int64_t integerProperty(std::string_view name) override {
    const auto it = integers.find(name);
    return it == integers.end() ? 0 : it->second;
  }
  bool booleanProperty(std::string_view name) override {
    const auto it = booleans.find(name);
    return it != booleans.end() && it->second;
  }
  bool hasAudioCaptureDevice() override { return audioCaptureDevice; }
  bool allowsInternalSecurityPolicies(std::string_view) override { return internalBuild; }
};

}  // namespace qv::fakes
