#pragma once

#include <set>
#include <string>

#include "platform/ScreenReader.h"

namespace qv::platform {

/// A screen reader runs while a process has one of the names that screen readers have on this device.
///
/// Threading: thread-safe.
class ProcessScreenReader final : public ScreenReader {
 public:
  /// Names as the kernel keeps them: 15 characters at most.
  explicit ProcessScreenReader(std::set<std::string> names) : names_(std::move(names)) {}
  [[nodiscard]] bool isRunning() override;

 private:
  const std::set<std::string> names_;
};

}  // namespace qv::platform
