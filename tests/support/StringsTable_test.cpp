#include "support/StringsTable.h"

#include <gtest/gtest.h>

#include <map>
#include <string>

namespace qv {
namespace {

using Texts = std::map<std::string, std::string, std::less<>>;

TEST(StringsTableTest, ReadsEntriesCommentsAndEscapes) {
  const auto table = parseStringsTable(
      "\xEF\xBB\xBF/* a \"comment\" = \"x\"; */\n"
      "\"A\"=\"plain\"; // to the end of the line\n"
      "  \"B\" = \"q\\\" b\\\\ n\\n t\\t u\\U00e9 \\uD83D\\uDE00 // not a comment\"\n;\n"
      "\"Ö\" = \"日本語\"; \"A\" = \"later\";//");
  EXPECT_EQ(table.fault, std::nullopt);
  EXPECT_EQ(table.texts, (Texts{{"A", "later"}, {"B", "q\" b\\ n\n t\t ué 😀 // not a comment"}, {"Ö", "日本語"}}));
}

TEST(StringsTableTest, KeepsWhatStandsBeforeAFault) {
  const std::string good = "\"A\" = \"a\";\n";
  for (const char* bad : {"\"B\"", "\"B\" = \"b\"", "\"B\" = \"b", "B = \"b\";", "\"B\" = b;", "\"B\" = \"b\\x\";",
                          "\"B\" = \"\\U12G4\";", "\"B\" = \"b\\", "/* open", "/*/", "\"B\" = \"\xC0\xAF\";",
                          "\"B\" = \"\xED\xA0\x80\";", "\"B\" = \"\xFF\";", "\"\xE2", "\xEF\xBB\xBF"}) {
    const auto table = parseStringsTable(good + bad + "\n\"C\" = \"c\";");
    EXPECT_EQ(table.texts, (Texts{{"A", "a"}})) << bad;
    ASSERT_TRUE(table.fault) << bad;
    EXPECT_TRUE(table.fault->starts_with("line ")) << *table.fault;
    const auto cutOff = parseStringsTable(good + bad);
    EXPECT_TRUE(cutOff.fault) << bad;
    EXPECT_EQ(cutOff.texts.size(), 1u) << bad;
  }
}

TEST(StringsTableTest, UnpairedSurrogatesAndZeroesAreReplaced) {
  const auto table = parseStringsTable(R"("A" = "\uD83D|\uDE00|\uD83D\u0041|\U0000";)");
  EXPECT_EQ(table.fault, std::nullopt);
  EXPECT_EQ(table.texts, (Texts{{"A", "\uFFFD|\uFFFD|\uFFFDA|\uFFFD"}}));
}

TEST(StringsTableTest, RefusesATableBeyondItsBound) {
  std::string table = "\"A\" = \"a\";";
  table.resize(kMaximumStringsTableSize, ' ');
  EXPECT_EQ(parseStringsTable(table).texts.size(), 1u);
  table += ' ';
  EXPECT_TRUE(parseStringsTable(table).fault);
}

}  // namespace
}  // namespace qv
