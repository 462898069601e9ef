#pragma once

#include <string>
#include <vector>

#include "platform/Bundles.h"
#include "platform/Localization.h"

namespace qv::platform {

inline constexpr std::string_view kLocalizationSuffix = ".lproj";

/// The path without links and "..", or the empty string.
[[nodiscard]] std::string canonicalPath(const std::string& path);

/// A bundle as a directory with an "Info.json", which is read once.
///
/// Threading: as Bundle.
class DirectoryBundle final : public Bundle {
 public:
  DirectoryBundle(std::string path, Localization& localization);

  [[nodiscard]] const std::string& path() const override { return path_; }
  [[nodiscard]] std::string resourcePath() const override;
  [[nodiscard]] const std::string& bundleIdentifier() const override { return identifier_; }
  [[nodiscard]] const Dictionary& infoDictionary() const override { return info_; }
  [[nodiscard]] Dictionary localizedInfoDictionary() const override;
  [[nodiscard]] std::vector<std::string> localizations() const override;
  [[nodiscard]] std::optional<std::string> pathForResource(std::string_view name, std::string_view type,
                                                           std::string_view localization) const override;

 private:
  const std::string path_;
  const Dictionary info_;
  const std::string identifier_;
  Localization& localization_;
};

}  // namespace qv::platform
