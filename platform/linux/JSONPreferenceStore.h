#pragma once

#include <string>
#include <utility>

#include "platform/Preferences.h"

namespace qv::platform {

/// Preferences in the files <directory>/<domain>.json, each a JSON dictionary. A broken file counts as none, with a log
/// line.
///
/// Threading: thread-safe, blocking.
class JSONPreferenceStore final : public PreferenceStore {
 public:
  explicit JSONPreferenceStore(std::string directory) : directory_(std::move(directory)) {}
  [[nodiscard]] Value valueForKey(const std::string& domain, const std::string& key) override;

 private:
  const std::string directory_;
};

}  // namespace qv::platform
