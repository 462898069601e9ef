#include "support/QVBundleTexts.h"

#include "tests/support/SupportTest.h"

namespace qv {
namespace {

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
  EXPECT_EQ(disk_.removeItem(kFramework), std::nullopt);
  EXPECT_EQ(texts_._qvFrameworkBundle(), bundle);
}

TEST_F(ExtensionsTest, TextsComeFromTheFirstBundleThatExists) {
  addTable("en", R"("K" = "en"; "ONLY_EN" = "en";)");
  addTable("fr", R"("K" = "fr";)");
  preferences_.setLanguages(R"(["fr-CA", "en"])");
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "fr");
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("ONLY_EN"), "ONLY_EN")
      << "a key that lacks shows itself";

  EXPECT_EQ(disk_.removeItem(lproj("fr")), std::nullopt);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "en");
  // None of the user's: the framework's own, of which there is no table.
  EXPECT_EQ(disk_.removeItem(lproj("en")), std::nullopt);
  EXPECT_EQ(texts_.localizedBundle(), nullptr);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("K"), "K");
}

TEST_F(ExtensionsTest, TheFallbackDropsScriptAndRegion) {
  addTable("zh", "");
  addTable("pt", "");
  preferences_.setLanguages(R"(["zh-Hant-TW"])");
  ASSERT_TRUE(texts_.fallbackBundle());
  EXPECT_EQ(texts_.fallbackBundle()->path(), disk_.at(lproj("zh")));
  preferences_.setLanguages(R"(["pt-BR", "zh"])");
  EXPECT_EQ(texts_.fallbackBundle()->path(), disk_.at(lproj("pt")));
  for (const char* others : {R"(["fr", "zh"])", "[]"}) {
    preferences_.setLanguages(others);
    EXPECT_EQ(texts_.fallbackBundle(), nullptr) << others;
  }
}

TEST_F(ExtensionsTest, ABrokenTableIsLoggedAndUsedUpToItsFault) {
  addTable("en", "\"A\" = \"a\";\n\"B\" = oops;");
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("A"), "a");
  EXPECT_EQ(log_.countContaining("line 2"), 1u);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("B"), "B");
  disk_.failOn(fakes::ScratchDisk::Operation::Read, lproj("en") + "/Localizable.strings", 5);
  EXPECT_EQ(texts_._qvLocalizedStringFromFrameworkBundleWithKey("A"), "A");
}

TEST_F(ExtensionsTest, ApplicationNamesByPrecedence) {
  const auto nameWith = [this](const std::string& names) {
    bundles_.addApplication("Chess", R"({"CFBundleIdentifier": "com.example.chess")" + names + "}");
    return texts_._qvLocalizedAppNameFromBundleID("com.example.chess");
  };
  EXPECT_EQ(texts_._qvLocalizedAppNameFromBundleID("com.example.chess"), std::nullopt);
  EXPECT_EQ(nameWith(""), "");
  EXPECT_EQ(nameWith(R"(, "CFBundleName": "name", "CFBundleDisplayName": 7)"), "name") << "a number is no name";
  const std::string display = R"(, "CFBundleName": "name", "CFBundleDisplayName": "display")";
  EXPECT_EQ(nameWith(display), "display");
  disk_.addFile("/root/Applications/Chess/Resources/en.lproj/InfoPlist.json", R"({"CFBundleDisplayName": "Schach"})");
  EXPECT_EQ(nameWith(display), "Schach");
}

}  // namespace
}  // namespace qv
