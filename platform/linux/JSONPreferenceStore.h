#pragma once

#include <string>

#include "platform/Preferences.h"

namespace qv::platform {

/// Preferences in <device root>/private/var/mobile/Library/Preferences/<domain>.json, each a JSON
/// dictionary. A broken file counts as none, with a log line.
///
/// Threading: thread-safe, blocking.
class JSONPreferenceStore final : public PreferenceStore {
 public:
  explicit JSONPreferenceStore(const std::string& deviceRoot);
  [[nodiscard]] Value valueForKey(const std::string& domain, const std::string& key) override;

 private:
  const std::string directory_;
};

}  // namespace qv::platform
