#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <string>

#include "support/QuorvelErrors.h"
#include "support/StringsTable.h"

namespace qv {
namespace {

const std::filesystem::path kResources = std::filesystem::path(QV_FRAMEWORK_DIR) / "Resources";

StringsTable tableAt(const std::string& localization) {
  std::ifstream file(kResources / (localization + ".lproj") / "Localizable.strings");
  return parseStringsTable(std::string(std::istreambuf_iterator<char>(file), {}));
}

size_t countOf(const std::string& part, const std::string& text) {
  size_t count = 0;
  for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) ++count;
  return count;
}

TEST(FrameworkTextsTest, EveryLanguageHasEveryTextWithTheSamePlaceholders) {
  const StringsTable english = tableAt("en");
  for (const RecordingError& error : kRecordingErrors) EXPECT_TRUE(english.texts.contains(error.key)) << error.key;
  ASSERT_EQ(english.texts.size(), kRecordingErrors.size() + 19) << "errors, and what the user is asked and told";
  std::set<std::string> languages;
  for (const auto& entry : std::filesystem::directory_iterator(kResources)) {
    const std::string language = entry.path().stem();
    languages.insert(language);
    const StringsTable table = tableAt(language);
    EXPECT_EQ(table.fault, std::nullopt) << language;
    EXPECT_EQ(table.texts.size(), english.texts.size()) << language;
    for (const auto& [key, text] : english.texts) {
      const auto translated = table.texts.find(key);
      ASSERT_NE(translated, table.texts.end()) << language << " " << key;
      EXPECT_FALSE(translated->second.empty()) << language << " " << key;
      EXPECT_EQ(countOf("%@", translated->second), countOf("%@", text)) << language << " " << key;
      EXPECT_EQ(countOf("%", translated->second), countOf("%", text)) << language << " " << key;
    }
  }
  EXPECT_EQ(languages, (std::set<std::string>{"de", "en", "es", "fr", "ja", "pt-BR", "zh-Hans", "zh-Hant"}));
}

TEST(FrameworkTextsTest, PlaceholdersStandWhereTheyAreFilledIn) {
  for (const auto& [key, text] : tableAt("en").texts) {
    const bool isFormat = key.ends_with("_TITLE") || key.ends_with("_FORMAT");
    EXPECT_EQ(countOf("%@", text), isFormat ? 1u : 0u) << key;
  }
}

}  // namespace
}  // namespace qv
