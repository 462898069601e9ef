#include "support/QVBundleTexts.h"

#include "tests/support/SupportTest.h"

namespace qv {
namespace {

using fakes::FakeBundle;
using platform::Value;

class ExtensionsTest : public SupportTest {
 protected:
  static std::string lproj(const std::string& name) {
    return std::string(kFramework) + "/Resources/" + name + ".lproj";
  }
};

TEST_F(ExtensionsTest, TheFrameworkIsFoundLateAndThenKept) {
  EXPECT_EQ(texts_._qvFrameworkBundle(), nullptr);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), std::nullopt);
  addTable("en", "");
  const auto bundle = texts_._qvFrameworkBundle();
  ASSERT_TRUE(bundle);
  bundles_.removeBundleAtPath(kFramework);
  EXPECT_EQ(texts_._qvFrameworkBundle(), bundle);
}

TEST_F(ExtensionsTest, TextsComeFromTheFirstBundleThatExists) {
  addTable("en", R"("K" = "en"; "ONLY_EN" = "en";)");
  addTable("fr", R"("K" = "fr";)");
  localization_.languages = {"fr-CA", "en"};
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "fr");
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("ONLY_EN"), "ONLY_EN")
      << "a key that lacks shows itself";

  addTable("de-AT", "");  // matches best, but the directory is gone
  addTable("de", R"("K" = "de";)");
  bundles_.removeBundleAtPath(lproj("de-AT"));
  localization_.languages = {"de-AT"};
  EXPECT_EQ(texts_.localizedBundle(), nullptr);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "de");

  bundles_.removeBundleAtPath(lproj("de"));
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "en") << "the default localization";
  framework_->info["CFBundleDevelopmentRegion"] = Value("fr");
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "fr");
}

TEST_F(ExtensionsTest, TheFallbackDropsScriptAndRegion) {
  addTable("zh", "");
  addTable("pt", "");
  localization_.languages = {"zh-Hant-TW"};
  ASSERT_TRUE(texts_.fallbackBundle());
  EXPECT_EQ(texts_.fallbackBundle()->path(), lproj("zh"));
  localization_.languages = {"pt-BR", "zh"};
  EXPECT_EQ(texts_.fallbackBundle()->path(), lproj("pt"));
  localization_.languages = {"fr", "zh"};
  EXPECT_EQ(texts_.fallbackBundle(), nullptr);
}

TEST_F(ExtensionsTest, ABrokenTableIsLoggedAndUsedUpToItsFault) {
  addTable("en", "\"A\" = \"a\";\n\"B\" = oops;");
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("A"), "a");
  EXPECT_EQ(log_.countContaining("line 2"), 1u);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("B"), "B");
  disk_.failOn(fakes::FakeFileSystem::Operation::Read, lproj("en") + "/Localizable.strings", 5);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("A"), "A");
}

TEST_F(ExtensionsTest, ApplicationNamesByPrecedence) {
  auto bundle = std::make_shared<FakeBundle>("/Applications/Chess", "com.example.chess");
  bundles_.add(bundle);
  EXPECT_EQ(texts_._qvLocalizedAppNameFromBundleID("com.example.chess"), "");
  EXPECT_EQ(texts_._qvLocalizedAppNameFromBundleID("com.example.other"), std::nullopt);
  bundle->info["CFBundleName"] = Value("name");
  EXPECT_EQ(texts_._qvLocalizedAppName(*bundle), "name");
  bundle->info["CFBundleDisplayName"] = Value(7);
  EXPECT_EQ(texts_._qvLocalizedAppName(*bundle), "name") << "a number is no name";
  bundle->info["CFBundleDisplayName"] = Value("display");
  EXPECT_EQ(texts_._qvLocalizedAppName(*bundle), "display");
  bundle->localizedInfo["CFBundleDisplayName"] = Value("Schach");
  EXPECT_EQ(texts_._qvLocalizedAppNameFromBundleID("com.example.chess"), "Schach");
}

TEST_F(ExtensionsTest, ProcessesBelongToTheBundleAroundTheirExecutable) {
  bundles_.addApplication("Chess", "com.example.chess");
  bundles_.setProcess(7, "/Applications/Chess/bin/chess");
  bundles_.setProcess(8, "/usr/bin/tool");
  bundles_.setProcess(9, "/Applications/Chess/" + std::string(5000, 'x'));
  ASSERT_TRUE(texts_.bundleWithPID(7));
  EXPECT_EQ(texts_.bundleWithPID(7)->bundleIdentifier(), "com.example.chess");
  for (const pid_t pid : {0, 1, 8, 9}) EXPECT_EQ(texts_.bundleWithPID(pid), nullptr) << pid;
}

TEST_F(ExtensionsTest, BaseIdentifierDropsTheLastComponent) {
  EXPECT_EQ(texts_.baseIdentifier("A.B.C.D"), "A.B.C");
  EXPECT_EQ(texts_.baseIdentifier("A.B"), "A");
  EXPECT_EQ(texts_.baseIdentifier("A"), "");
  EXPECT_EQ(texts_.baseIdentifier("A."), "A");
  EXPECT_EQ(texts_.baseIdentifier(std::nullopt), std::nullopt);
}

}  // namespace
}  // namespace qv
