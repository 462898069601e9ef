#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "platform/Platform.h"
#include "support/QVBundleTexts.h"
#include "support/QVTemporaryFiles.h"
#include "tests/fakes/FakeBundles.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeFileSystem.h"
#include "tests/fakes/FakeLocalization.h"
#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ManualExecutor.h"

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
    if (!framework_) framework_ = std::make_shared<fakes::FakeBundle>(kFramework);
    framework_->resources[localization] = {"Localizable.strings"};
    bundles_.add(framework_);
    const std::string directory = framework_->resourcePath() + "/" + localization + ".lproj";
    auto bundle = std::make_shared<fakes::FakeBundle>(directory);
    bundle->hasResourceDirectory = false;
    bundle->resources[""] = {"Localizable.strings"};
    bundles_.add(bundle);
    disk_.addFile(directory + "/Localizable.strings", content);
  }

  fakes::FakeClock clock_;
  fakes::ManualExecutor global_;
  fakes::ManualExecutor background_;
  fakes::FakeFileSystem disk_;
  fakes::FakeBundleService bundles_;
  fakes::FakeLocalization localization_;
  fakes::LogRecorder log_;
  std::shared_ptr<fakes::FakeBundle> framework_;
  platform::Platform platform_;
  const QVTemporaryFiles files_{platform_};
  const QVBundleTexts texts_{platform_};
};

}  // namespace qv
