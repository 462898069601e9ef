#include "platform/linux/ICULocalization.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <time.h>

#include <map>

#include "tests/fakes/ScratchPreferences.h"
#include "tests/kit/ScratchFolder.h"

namespace qv::platform {
namespace {

using Tags = std::vector<std::string>;

class ICULocalizationTest : public testing::Test {
 protected:
  Tags languages(std::map<std::string, std::string> environment) {
    ICULocalization localization(preferences_.store, "com.tarnwick.quorveld",
                                 [&](const char* name) { return environment[name]; });
    return localization.preferredLanguages();
  }
  kit::ScratchFolder root_;
  fakes::ScratchPreferences preferences_{root_.path()};
  ICULocalization& localization_ = preferences_.localization;
};

TEST_F(ICULocalizationTest, LanguagesComeFromTheEnvironmentOrThePreferences) {
  EXPECT_EQ(languages({}), Tags{"en"});
  EXPECT_EQ(languages({{"LANG", "C.UTF-8"}, {"LANGUAGE", "fr"}}), Tags{"en"});
  EXPECT_EQ(languages({{"LANG", "pt_BR.UTF-8"}}), Tags{"pt-BR"});
  EXPECT_EQ(languages({{"LANG", "de_DE"}, {"LC_ALL", "sr_RS.UTF-8@latin"}}), Tags{"sr-Latn-RS"});
  EXPECT_EQ(languages({{"LANG", "de_DE.UTF-8"}, {"LANGUAGE", "fr_CA:fr::de_DE"}}), (Tags{"fr-CA", "fr", "de-DE"}));
  preferences_.setLanguages(R"(["zh-Hant-TW", 3, "ja"])");
  EXPECT_EQ(languages({{"LANG", "de_DE.UTF-8"}}), (Tags{"zh-Hant-TW", "ja"}));
}

TEST_F(ICULocalizationTest, MatchesScriptsAndRegions) {
  const Tags available{"de", "en", "es", "fr", "ja", "pt-BR", "zh-Hans", "zh-Hant"};
  const auto best = [&](const Tags& preferred) {
    return localization_.matchLocalizations(available, preferred).front();
  };
  EXPECT_EQ(best({"zh-TW"}), "zh-Hant");
  EXPECT_EQ(best({"zh-HK"}), "zh-Hant");
  EXPECT_EQ(best({"zh-SG"}), "zh-Hans");
  EXPECT_EQ(best({"pt-PT"}), "pt-BR");
  EXPECT_EQ(best({"es-419"}), "es");
  EXPECT_EQ(best({"de-AT", "fr"}), "de");
  EXPECT_EQ(best({"xx-nonsense!", "fr-CA"}), "fr");
  EXPECT_EQ(best({"ko"}), "en") << "nothing matches";
  EXPECT_EQ(best({}), "en");
  EXPECT_EQ(localization_.matchLocalizations({"en-GB", "fr", "en", "ja"}, {"en-AU", "fr-CH"}),
            (Tags{"en-GB", "en", "fr"}));
  EXPECT_EQ(localization_.matchLocalizations({"ja", "ko"}, {"fr"}), Tags{"ja"});
  EXPECT_EQ(localization_.matchLocalizations({"not a tag", "fr"}, {"fr"}), Tags{"fr"});
  EXPECT_EQ(localization_.matchLocalizations({}, {"fr"}), Tags{});
}

TEST_F(ICULocalizationTest, DatesAreLocalTimeInPlainDigits) {
  ::setenv("TZ", "Asia/Kolkata", 1);
  ::tzset();
  const Date date{1767268800.0};  // 12:00 UTC, 17:30 there
  EXPECT_EQ(localization_.formatDate(date, "MM-dd-yyyy HH:mm:ss"), "01-01-2026 17:30:00");
  preferences_.setLanguages(R"(["ar-EG"])");
  EXPECT_EQ(localization_.formatDate(date, "MM-dd-yyyy HH:mm:ss"), "01-01-2026 17:30:00");
  preferences_.setLanguages(R"(["de"])");
  EXPECT_EQ(localization_.formatDate(date, "EEEE, d. MMMM"), "Donnerstag, 1. Januar");
  ::setenv("TZ", "UTC", 1);
  ::tzset();
  EXPECT_EQ(localization_.formatDate(date, "HH:mm"), "12:00");
}

TEST_F(ICULocalizationTest, FoldsCaseAndDiacritics) {
  EXPECT_TRUE(localization_.beginsWithFolded("Clip_1.mp4", "clip"));
  EXPECT_TRUE(localization_.beginsWithFolded("\u00c9checs.mp4", "ec"));
  EXPECT_TRUE(localization_.beginsWithFolded("e\u0301checs", "\u00c9C"));
  EXPECT_TRUE(localization_.beginsWithFolded("Straße", "STRASS"));
  EXPECT_FALSE(localization_.beginsWithFolded("myclip.mp4", "clip"));
  EXPECT_FALSE(localization_.beginsWithFolded("cli", "clip"));
  EXPECT_TRUE(localization_.beginsWithFolded("anything", ""));
  EXPECT_TRUE(localization_.beginsWithFolded("\xFFz", "\xFF"));
}

}  // namespace
}  // namespace qv::platform
