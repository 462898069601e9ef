#include "platform/linux/Json.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <limits>
#include <string>

namespace qv::platform {
namespace {

TEST(JsonTest, ReadsEveryKind) {
  const auto value =
      parseJSON(R"({"a": [1, -2, 18446744073709551615, 1.5, true, null, "t\u00e9\n", {}], "a2": 1, "a2": 2})");
  ASSERT_TRUE(value);
  const Dictionary expected{
      {"a", Value(Array{Value(int64_t{1}), Value(int64_t{-2}), Value(std::numeric_limits<uint64_t>::max()), Value(1.5),
                        Value(true), Value(), Value("t\u00e9\n"), Value(Dictionary{})})},
      {"a2", Value(int64_t{2})}};
  EXPECT_EQ(value.value(), Value(expected));
}

TEST(JsonTest, RefusesWhatIsBrokenOrHostile) {
  const std::string deep(static_cast<size_t>(kMaximumJSONDepth) + 1, '[');
  const std::string veryDeep(1'000'000, '[');
  for (const std::string& text :
       {std::string(), std::string("{"), std::string("{\"a\":}"), std::string("[1,]"), std::string("{} {}"),
        std::string("nul"), std::string("1e999"), std::string("\"\xFF\""), std::string(R"("\ud800")"),
        std::string(R"(["a\u0000b"])"), std::string(R"({"a\u0000b": 1})"), std::string("[\0]", 3), deep, veryDeep,
        std::string((1 << 20) + 1, ' ')}) {
    const auto value = parseJSON(text);
    ASSERT_FALSE(value) << text.substr(0, 40);
    EXPECT_EQ(value.error().code, EBADMSG);
  }
  std::string fits(kMaximumJSONDepth, '[');
  fits += std::string(kMaximumJSONDepth, ']');
  EXPECT_TRUE(parseJSON(fits));
}

TEST(JsonTest, WritesOneLineWhatever) {
  const Dictionary dictionary{{"data", Value(Data{1, 255})},
                              {"date", Value(Date{1.5})},
                              {"nan", Value(std::numeric_limits<double>::quiet_NaN())},
                              {"none", Value()},
                              {"text", Value("line\nfeed \xFF")},
                              {"url", Value(URL::fileURL("/a b"))}};
  EXPECT_EQ(serializeJSON(Value(dictionary)),
            "{\"data\":[1,255],\"date\":1.5,\"nan\":null,\"none\":null,\"text\":\"line\\nfeed \xEF\xBF\xBD\","
            "\"url\":\"file:///a%20b\"}");
}

}  // namespace
}  // namespace qv::platform
