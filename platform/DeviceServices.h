#pragma once

#include <optional>
#include <string>

#include "platform/base/Error.h"

namespace qv::platform {

/// What stands behind one of the device's services now.
struct ServiceState {
  std::string backend;                        ///< e.g. "X11", "PulseAudio", "headless"
  std::optional<Error> fault = std::nullopt;  ///< why nobody answers there
};

struct DeviceServices {
  ServiceState display;  ///< screen, applications and alerts
  ServiceState sound;    ///< application sound and the microphone
  ServiceState movies;   ///< the encoders
};

/// Looks whether the services of the device answer, for whoever takes care of it. No recording asks.
///
/// Threading: thread-safe, blocking: a server that hangs is waited for, some seconds at most.
class DeviceServicesQuery {
 public:
  virtual ~DeviceServicesQuery() = default;
  [[nodiscard]] virtual DeviceServices look() = 0;
};

}  // namespace qv::platform
