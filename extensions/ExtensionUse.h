#pragma once

#include <memory>

#include "platform/Extensions.h"

namespace qv {

/// While one lives, an extension's process may run; the end of the last one ends the process. So the end of a broadcast
/// that still sends its last clips does not take the process away from the next broadcast.
///
/// Threading: thread-safe.
class ExtensionUse {
 public:
  static std::shared_ptr<ExtensionUse> of(const platform::ExtensionRecordRef& extension);
  explicit ExtensionUse(platform::ExtensionRecordRef extension) : extension_(std::move(extension)) {}
  ~ExtensionUse();
  ExtensionUse(const ExtensionUse&) = delete;
  ExtensionUse& operator=(const ExtensionUse&) = delete;

 private:
  const platform::ExtensionRecordRef extension_;
};

}  // namespace qv
