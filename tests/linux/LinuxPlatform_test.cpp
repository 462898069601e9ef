#include "platform/linux/LinuxPlatform.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>

#include "support/QuorvelErrors.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

TEST(LinuxPlatformTest, ErrorsSpeakTheUsersLanguageOnARealDisk) {
  kit::ScratchFolder root;
  const std::filesystem::path framework = root.path("/System/Library/Frameworks/Quorvel.framework");
  std::filesystem::create_directories(framework.parent_path());
  std::filesystem::copy(QV_FRAMEWORK_DIR, framework, std::filesystem::copy_options::recursive);
  root.write("/Preferences/com.tarnwick.quorveld.json", R"({"Languages": ["de-CH"]})");
  LinuxPlatform linux_({.root = root.path(),
                        .bundlePath = {},
                        .preferences = "/Preferences",
                        .preferenceDomain = "com.tarnwick.quorveld",
                        .photoLibrary = "/Movies",
                        .metrics = "/Logs",
                        .watchedPath = "/",
                        .sessionUser = ::geteuid()});
  Platform platform;
  linux_.addTo(platform);
  const QVBundleTexts texts(platform);
  EXPECT_EQ(QuorvelErrors(texts)._qvUserErrorForCode(errorcode::kFailed).localizedDescription(),
            "Die Aufnahme ist fehlgeschlagen.");
}

}  // namespace
}  // namespace qv::platform
