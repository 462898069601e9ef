#pragma once

#include <cstdint>

namespace qv::platform {

/// Short sounds of the system, played on the device's output.
///
/// Threading: thread-safe; returns at once.
class SystemSounds {
 public:
  virtual ~SystemSounds() = default;
  /// 1117: recording begins; 1118: recording ends. Others are ignored with a log line.
  virtual void play(uint32_t soundID) = 0;
};

}  // namespace qv::platform
