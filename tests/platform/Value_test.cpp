#include "platform/base/Value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/base/Error.h"

namespace qv::platform {
namespace {

TEST(ValueTest, ReadersConvertNumbersAndRefuseTheRest) {
  EXPECT_EQ(Value(-1.9).asInteger(), -1);
  EXPECT_EQ(Value(1e300).asInteger(), std::numeric_limits<int64_t>::max());
  EXPECT_EQ(Value(-1e300).asInteger(), std::numeric_limits<int64_t>::min());
  EXPECT_EQ(Value(std::nan("")).asInteger(), 0);
  EXPECT_EQ(Value(std::numeric_limits<uint64_t>::max()).asInteger(), std::numeric_limits<int64_t>::max());
  EXPECT_EQ(Value("7").asInteger(3), 3);
  EXPECT_TRUE(Value(0.5).asBool());
  EXPECT_TRUE(Value("yes").asBool(true));
  EXPECT_EQ(Value(uint32_t{7}).asDouble(), 7.0);
  EXPECT_TRUE(Value(7).asDictionary().empty());
  EXPECT_FALSE(Value(int32_t{1}) == Value(int64_t{1})) << "the kind is the type on the wire";
}

TEST(URLTest, PathsSurviveTheirEncoding) {
  for (const char* path : {"/plain", "/with space/\xC3\xBC \xE6\x97\xA5", "/100%/a#b?c", "/"}) {
    EXPECT_EQ(URL::fileURL(path).path(), path);
  }
  EXPECT_EQ(URL::fileURL("/a b%").absoluteString(), "file:///a%20b%25");
  EXPECT_EQ(URL("file:///broken%2").path(), "/broken%2");
  EXPECT_EQ(URL("file:///etc%00/passwd").path(), "");
  EXPECT_EQ(URL("https://example.com/a").path(), "");
  EXPECT_EQ(URL("file://host/a").path(), "");
}

TEST(ErrorTest, EncodingKeepsEverythingAndAbsence) {
  const Error error{"domain", -5818, {{kLocalizedDescriptionKey, Value("text")}, {"n", Value(7)}}};
  EXPECT_EQ(decodeError(encodeError(error)), error);
  EXPECT_EQ(decodeError(encodeError(std::nullopt)), std::nullopt);
  EXPECT_EQ(error.description(), "domain -5818 (text)");
}

}  // namespace
}  // namespace qv::platform
