#pragma once

namespace qv::platform {

/// Whether the platform's screen reader is running.
class ScreenReader {
 public:
  virtual ~ScreenReader() = default;
  [[nodiscard]] virtual bool isRunning() = 0;
};

}  // namespace qv::platform
