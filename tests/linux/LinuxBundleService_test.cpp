#include "platform/linux/LinuxBundleService.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>

#include "tests/fakes/LogRecorder.h"
#include "tests/fakes/ScratchPreferences.h"
#include "tests/kit/Process.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

class LinuxBundleServiceTest : public testing::Test {
 protected:
  LinuxBundleServiceTest() : bundles_(root_.path(), root_.path("/developer") + ":relative", localization_) {}

  void install(const std::string& path, const std::string& identifier) {
    root_.write(path + "/Info.json", R"({"CFBundleIdentifier": ")" + identifier + R"(", "CFBundleName": "N"})");
  }
  std::string enclosing(const std::string& path) {
    const BundleRef bundle = bundles_.bundleEnclosingExecutable(path);
    return bundle ? bundle->bundleIdentifier() : "none";
  }

  kit::ScratchFolder root_;
  fakes::LogRecorder log_;
  fakes::ScratchPreferences preferences_{root_.path("/preferences")};
  Localization& localization_ = preferences_.localization;
  LinuxBundleService bundles_;
};

TEST_F(LinuxBundleServiceTest, FindsByIdentifierInTheRoots) {
  install("/Applications/Games/Chess", "com.example.chess");
  install("/Applications/Games/Chess/PlugIns/Upload", "com.example.chess.upload");
  install("/developer/Demo", "com.example.demo");
  install("/home/user/Fake", "com.example.fake");
  root_.write("/Applications/Broken/Info.json", "{");
  for (const char* identifier : {"com.example.chess", "com.example.chess.upload", "com.example.demo"}) {
    ASSERT_TRUE(bundles_.bundleWithIdentifier(identifier)) << identifier;
    EXPECT_EQ(bundles_.bundleWithIdentifier(identifier)->bundleIdentifier(), identifier);
  }
  EXPECT_EQ(bundles_.bundleWithIdentifier("com.example.fake"), nullptr);
  EXPECT_EQ(bundles_.bundleWithIdentifier(""), nullptr);
  EXPECT_GT(log_.countContaining("Broken/Info.json"), 0u);
  install("/Applications/Late", "com.example.fake");
  EXPECT_TRUE(bundles_.bundleWithIdentifier("com.example.fake")) << "a new installation is seen at once";
}

TEST_F(LinuxBundleServiceTest, WhatIsKnownFollowsEveryChange) {
  const auto nameOf = [&](const char* identifier) {
    const BundleRef bundle = bundles_.bundleWithIdentifier(identifier);
    return bundle ? bundle->path().substr(root_.path().size()) : "none";
  };
  install("/Applications/Chess", "com.example.chess");
  EXPECT_EQ(nameOf("com.example.chess"), "/Applications/Chess");
  EXPECT_EQ(nameOf("com.example.chess.upload"), "none");
  install("/Applications/Chess/PlugIns/Upload", "com.example.chess.upload");
  EXPECT_EQ(nameOf("com.example.chess.upload"), "/Applications/Chess/PlugIns/Upload");
  install("/Applications/Chess", "com.example.go");
  EXPECT_EQ(nameOf("com.example.chess"), "none") << "written anew in place";
  EXPECT_EQ(nameOf("com.example.go"), "/Applications/Chess");
  std::filesystem::rename(root_.path("/Applications/Chess"), root_.path("/Applications/Go"));
  EXPECT_EQ(nameOf("com.example.go"), "/Applications/Go");
  EXPECT_EQ(nameOf("com.example.chess.upload"), "/Applications/Go/PlugIns/Upload");
  std::filesystem::remove(root_.path("/Applications/Go/Info.json"));
  EXPECT_EQ(nameOf("com.example.go"), "none");
  EXPECT_EQ(nameOf("com.example.chess.upload"), "/Applications/Go/PlugIns/Upload") << "in a plain directory now";
  std::filesystem::remove_all(root_.path("/Applications"));
  EXPECT_EQ(nameOf("com.example.chess.upload"), "none");
  EXPECT_TRUE(bundles_.installedBundles().empty());
}

TEST_F(LinuxBundleServiceTest, NoBundleHidesAnother) {
  install("/Applications/A", "com.example.a");
  install("/Applications/A/Data/Inner", "com.example.inner");
  for (int i = 0; i < 1010; ++i)
    std::filesystem::create_directories(root_.path("/Applications/B/" + std::to_string(i)));
  install("/Applications/C", "com.example.c");
  install("/Applications/C/PlugIns/Upload", "com.example.c.upload");
  EXPECT_TRUE(bundles_.bundleWithIdentifier("com.example.c.upload"));
  EXPECT_FALSE(bundles_.bundleWithIdentifier("com.example.inner")) << "not where plug-ins are";
  EXPECT_EQ(bundles_.installedBundles().size(), 3u);
  EXPECT_GT(log_.countContaining("too many directories"), 0u) << "in B";
  EXPECT_LT(log_.countContaining("too many directories"), 10u);
}

TEST_F(LinuxBundleServiceTest, TheNearestBundleInsideARootEncloses) {
  install("/Applications/Chess", "com.example.chess");
  install("/Applications/Chess/PlugIns/Upload", "com.example.chess.upload");
  install("/home/user/Fake", "com.example.chess");
  const std::string chess = root_.write("/Applications/Chess/bin/linux/chess", "");
  EXPECT_EQ(enclosing(chess), "com.example.chess");
  EXPECT_EQ(enclosing(root_.write("/Applications/Chess/PlugIns/Upload/bin/up", "")), "com.example.chess.upload");
  EXPECT_EQ(enclosing(root_.write("/Applications/stray", "")), "none");
  EXPECT_EQ(enclosing(root_.write("/Applications2/Chess/x", "")), "none");
  const std::string fake = root_.write("/home/user/Fake/bin/x", "");
  EXPECT_EQ(enclosing(fake), "none");
  EXPECT_EQ(enclosing(root_.path("/Applications/Chess/../../home/user/Fake/bin/x")), "none");
  std::filesystem::create_symlink(fake, root_.path("/Applications/Chess/bin/link"));
  EXPECT_EQ(enclosing(root_.path("/Applications/Chess/bin/link")), "none");
  root_.write("/Applications/Chess/bin/Info.json", "broken");
  EXPECT_EQ(enclosing(chess), "") << "a broken nearest bundle has no identity, least of all another's";
}

TEST_F(LinuxBundleServiceTest, ResourcesAndLocalizations) {
  install("/Applications/Chess", "com.example.chess");
  const BundleRef flat = bundles_.bundleAtPath(root_.path("/Applications/Chess"));
  ASSERT_TRUE(flat);
  EXPECT_EQ(flat->resourcePath(), flat->path());
  EXPECT_TRUE(flat->localizations().empty());
  EXPECT_TRUE(flat->localizedInfoDictionary().empty());

  const std::string table = root_.write("/Applications/Chess/Resources/fr.lproj/Localizable.strings", "");
  root_.write("/Applications/Chess/Resources/en.lproj/InfoPlist.json", R"({"CFBundleDisplayName": "Chess"})");
  root_.write("/Applications/Chess/Resources/fr.lproj/InfoPlist.json", R"({"CFBundleDisplayName": "Échecs"})");
  root_.write("/Applications/Chess/Resources/de.lproj", "a file");
  EXPECT_EQ(flat->localizations(), (std::vector<std::string>{"en", "fr"}));
  EXPECT_EQ(flat->pathForResource("Localizable", "strings", "fr"), table);
  EXPECT_EQ(flat->pathForResource("Localizable", "strings", "en"), std::nullopt);
  EXPECT_EQ(flat->pathForResource("Info", "json", "../../../Chess/x"), std::nullopt);
  preferences_.setLanguages(R"(["fr-CA"])");
  EXPECT_EQ(valueForKey(flat->localizedInfoDictionary(), "CFBundleDisplayName").asString(), "Échecs");

  const BundleRef french = bundles_.bundleAtPath(root_.path("/Applications/Chess/Resources/fr.lproj"));
  ASSERT_TRUE(french);
  EXPECT_EQ(french->pathForResource("Localizable", "strings", ""), table);
  EXPECT_EQ(bundles_.bundleAtPath(table), nullptr);
}

TEST_F(LinuxBundleServiceTest, RelativeRootsAreRefused) { EXPECT_EQ(log_.countContaining("relative"), 1u); }

TEST_F(LinuxBundleServiceTest, AnExecutableIsBelievedOnlyWhileItStandsAtItsPath) {
  EXPECT_EQ(bundles_.executablePathOfProcess(::getpid()), std::filesystem::read_symlink("/proc/self/exe"));
  EXPECT_EQ(bundles_.executablePathOfProcess(0), std::nullopt);
  EXPECT_EQ(bundles_.executablePathOfProcess(-1), std::nullopt);

  const std::string program = root_.path("/program");
  std::filesystem::copy_file("/bin/sleep", program);
  kit::Process process(program, {"60"});
  const pid_t child = process.pid();
  EXPECT_EQ(bundles_.executablePathOfProcess(child), std::filesystem::canonical(program));
  std::filesystem::remove(program);
  EXPECT_EQ(bundles_.executablePathOfProcess(child), std::nullopt);
  root_.write("/program (deleted)", "what the kernel calls it now");
  EXPECT_EQ(bundles_.executablePathOfProcess(child), std::nullopt);
  process.kill();
  EXPECT_EQ(bundles_.executablePathOfProcess(child), std::nullopt);
}

}  // namespace
}  // namespace qv::platform
