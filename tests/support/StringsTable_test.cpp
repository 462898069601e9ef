#include "support/StringsTable.h"

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <string_view>
#include <utility>

namespace qv {
namespace {

using Texts = std::map<std::string, std::string, std::less<>>;

TEST(StringsTableTest, ReadsEntriesCommentsAndEscapes) {
  const auto table = parseStringsTable(
      "\xEF\xBB\xBF/* a \"comment\" = \"x\"; */\n"
      "\"A\"=\"plain\"; // to the end of the line\n"
      "/**/\"D\"=\"d\";//\n\"E\"=\"e\";"
      "  \"B\" = \"q\\\" b\\\\ n\\n t\\t u\\U00e9 \\uD83D\\uDE00 // not a comment\"\n;\n"
      "\"Ö\" = \"日本語\"; \"A\" = \"later\";//");
  EXPECT_EQ(table.fault, std::nullopt);
  EXPECT_EQ(
      table.texts,
      (Texts{{"A", "later"}, {"B", "q\" b\\ n\n t\t ué 😀 // not a comment"}, {"D", "d"}, {"E", "e"}, {"Ö", "日本語"}}));
}

TEST(StringsTableTest, KeepsWhatStandsBeforeAFaultAndTellsWhereItIs) {
  const std::string good = "\n\"A\" = \"a\";\n";
  const std::pair<std::string, const char*> faults[] = {
      {"\"B\"", "line 4: '=' expected"},
      {"\"B\" = \"b\"", "line 4: ';' expected"},
      {"\"B\" = \"b", "line 4: ';' expected"},
      {"B = \"b\";", "line 3: '\"' expected"},
      {"\"B\" = b;", "line 3: '\"' expected"},
      {"\"B\" = \"b\\x\";", "line 3: unknown escape"},
      {"\"B\" = \"b\\", "line 4: unknown escape"},
      {"\"B\" = \"\\U12G4\";", "line 3: four hexadecimal digits expected"},
      {"/* open", "line 3: comment without end"},
      {"\"B\" /* open", "line 3: comment without end"},
      {"\"B\" = /*/", "line 3: comment without end"},
      {"\xEF\xBB\xBF", "line 3: '\"' expected"}};
  for (const auto& [bad, fault] : faults) {
    const auto table = parseStringsTable(good + bad + "\n\"C\" = \"c\";");
    EXPECT_EQ(table.texts, (Texts{{"A", "a"}})) << bad;
    EXPECT_EQ(table.fault, fault) << bad;
    const auto cutOff = parseStringsTable(good + bad);
    EXPECT_TRUE(cutOff.fault) << bad;
    EXPECT_EQ(cutOff.texts.size(), 1u) << bad;
  }
}

TEST(StringsTableTest, ReadsNothingBehindItsEnd) {
  const std::string whole = "\"A\" = \"\\U12344é\\n\\\\\"; /* b */ // c\n\"D\" = \"😀\";";
  for (size_t size = 0; size < whole.size(); ++size) {
    const auto part = parseStringsTable(std::string_view(whole).substr(0, size));
    const auto copy = parseStringsTable(whole.substr(0, size));
    EXPECT_EQ(part.texts, copy.texts) << size;
    EXPECT_EQ(part.fault, copy.fault) << size;
  }
  EXPECT_EQ(parseStringsTable("\"A\" = \"é").fault, "line 1: text without end");
}

TEST(StringsTableTest, TakesUtf8AndEscapesUpToTheirBoundsAndNothingElse) {
  const std::pair<std::string, const char*> characters[] = {{"\\U0001", "\x01"},
                                                            {"\\U007f", "\x7F"},
                                                            {"\\u0080", "\xC2\x80"},
                                                            {"\\u07FF", "\xDF\xBF"},
                                                            {"\\u0800", "\xE0\xA0\x80"},
                                                            {"\\ud7ff", "\xED\x9F\xBF"},
                                                            {"\\ue000", "\xEE\x80\x80"},
                                                            {"\\uFFFF", "\xEF\xBF\xBF"},
                                                            {"\\uD800\\uDC00", "\xF0\x90\x80\x80"},
                                                            {"\\uDBFF\\uDFFF", "\xF4\x8F\xBF\xBF"}};
  for (const auto& [escape, utf8] : characters) {
    const auto table = parseStringsTable("\"A\" = \"" + escape + "\"; \"B\" = \"" + utf8 + "\";");
    EXPECT_EQ(table.texts, (Texts{{"A", utf8}, {"B", utf8}})) << escape;
  }
  for (const std::string bad :
       {"\x80", "\x80\x80", "\xC0\xAF", "\xC1\xBF", "\xE0\x9F\xBF", "\xED\xA0\x80", "\xF0\x8F\xBF\xBF",
        "\xF4\x90\x80\x80", "\xF5\x80\x80\x80", "\xFF", "\xC3(", "\xE1\x80(", "\xE1(\x80", "\xE2"}) {
    EXPECT_EQ(parseStringsTable("\"A\" = \"" + bad + "\";").fault, "line 1: not UTF-8") << bad;
  }
  EXPECT_TRUE(parseStringsTable(std::string("\"A\" = \"\0\";", 9)).fault);
}

TEST(StringsTableTest, UnpairedSurrogatesAndZeroesAreReplaced) {
  const auto table =
      parseStringsTable(R"("A" = "\uD83D|\uDE00|\uD83D\u0041|\U0000|\u0041\uDE00|\uDC00\uDC00|\uD83D\uE000|\uD800";)");
  EXPECT_EQ(table.fault, std::nullopt);
  EXPECT_EQ(table.texts, (Texts{{"A", "\uFFFD|\uFFFD|\uFFFDA|\uFFFD|A\uFFFD|\uFFFD\uFFFD|\uFFFD\uE000|\uFFFD"}}));
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
