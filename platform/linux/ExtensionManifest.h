#pragma once

#include <string>
#include <vector>

#include "platform/Bundles.h"
#include "platform/Extensions.h"

namespace qv::platform {

/// What an extension's information dictionary says (extensioninfo), checked as far as that goes without the disk.
struct ExtensionManifest {
  std::string identifier;  ///< safe as the name of a file
  std::string extensionPointIdentifier;
  std::string executable;          ///< relative to the bundle, without ".."
  std::vector<std::string> icons;  ///< relative to the resources, without ".."; at most 16
  Dictionary attributes;
};

/// Whether a bundle says of itself that it is an extension.
[[nodiscard]] bool isExtensionInfo(const Dictionary& info);
/// Any input is safe; the error (domain posix, EBADMSG) says what is missing or wrong. Unusable icons are left out.
[[nodiscard]] Result<ExtensionManifest> parseExtensionManifest(const Dictionary& info);
/// The manifest of a bundle with what it names: the executable must be an executable plain file that lies, links
/// resolved, in the bundle; icons that are no PNG files in the bundle, or over 1 MiB, are logged and left out.
[[nodiscard]] Result<ExtensionRecordRef> makeExtensionRecord(const Bundle& bundle);

}  // namespace qv::platform
