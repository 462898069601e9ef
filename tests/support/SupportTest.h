#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "platform/Platform.h"
#include "support/QVBundleTexts.h"
#include "support/QVTemporaryFiles.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ManualExecutor.h"
#include "tests/fakes/ScratchBundles.h"
#include "tests/fakes/ScratchDisk.h"
#include "tests/fakes/ScratchPreferences.h"

namespace qv {

inline constexpr const char kFramework[] = "/root/System/Library/Frameworks/Quorvel.framework";

/// A platform of fakes under the device root "/root".
class SupportTest : public testing::Test {
 protected:
  SupportTest() {
    platform_.clock = &clock_;
    platform_.globalQueue = &global_;
    platform_.backgroundQueue = &background_;
    platform_.deviceRoot = "/root";
    platform_.fileSystem = &disk_;
    platform_.bundles = &bundles_;
    platform_.localization = &localization_;
  }

  /// Gives the framework one localization with a table.
  void addTable(const std::string& localization, const std::string& content) {
    const std::string directory = std::string(kFramework) + "/Resources/" + localization + ".lproj";
    disk_.addFile(directory + "/Localizable.strings", content);
  }

  fakes::FakeClock clock_;
  fakes::ManualExecutor global_;
  fakes::ManualExecutor background_;
  fakes::ScratchDisk disk_;
  fakes::ScratchPreferences preferences_{disk_.at("/root/preferences")};
  platform::Localization& localization_ = preferences_.localization;
  fakes::ScratchBundles bundles_{disk_, "/root", localization_};
  fakes::LogRecorder log_;
  platform::Platform platform_;
  const QVTemporaryFiles files_{platform_};
  const QVBundleTexts texts_{platform_};
};

}  // namespace qv
