#pragma once

#include <string>

#include "platform/base/Value.h"

namespace qv::platform {

/// Preferences, one JSON file per domain, read at each use.
///
/// Threading: thread-safe, blocking.
class PreferenceStore {
 public:
  virtual ~PreferenceStore() = default;
  /// None where the key, the file, or a readable file is missing.
  [[nodiscard]] virtual Value valueForKey(const std::string& domain, const std::string& key) = 0;
};

}  // namespace qv::platform
