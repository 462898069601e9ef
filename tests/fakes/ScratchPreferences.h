#pragma once

#include <filesystem>
#include <fstream>
#include <string>
#include <utility>

#include "platform/linux/ICULocalization.h"
#include "platform/linux/JSONPreferenceStore.h"

namespace qv::fakes {

/// Preferences in files of a scratch folder, and the languages that they name; English as they come. The environment
/// has no say.
///
/// Threading: set it up before it is shared.
class ScratchPreferences {
 public:
  /// The daemon's own.
  static constexpr const char* kDomain = "com.tarnwick.quorveld";
  explicit ScratchPreferences(std::string directory) : directory_(std::move(directory)) {}

  /// All preferences of the domain, as JSON.
  void set(const std::string& json) {
    std::filesystem::create_directories(directory_);
    std::ofstream(directory_ + "/" + kDomain + ".json") << json;
  }
  /// A JSON array of tags, and no other preference.
  void setLanguages(const std::string& tags) { set(R"({"Languages": )" + tags + "}"); }

 private:
  const std::string directory_;

 public:
  platform::JSONPreferenceStore store{directory_};
  platform::ICULocalization localization{store, kDomain, [](const char*) { return std::string(); }};
};

}  // namespace qv::fakes
