#pragma once

#include <filesystem>

#include "tests/kit/ScratchFolder.h"

namespace qv::security {

/// A device's root for a daemon that asks nobody, which other users may enter.
///
/// Threading: as the file system.
class DaemonRoot : public kit::ScratchFolder {
 public:
  DaemonRoot() {
    namespace fs = std::filesystem;
    fs::permissions(path(), fs::perms(0755));
    write("/etc/quorvel/device.json", R"({"internalBuild": true})");
    write("/private/var/mobile/Library/Preferences/com.tarnwick.quorveld.json", R"({"QVSuppressAlert": true})");
    fs::create_directories(path("/System/Library/Frameworks"));
    fs::copy(QV_FRAMEWORK_DIR, path("/System/Library/Frameworks/Quorvel.framework"), fs::copy_options::recursive);
  }
};

}  // namespace qv::security
